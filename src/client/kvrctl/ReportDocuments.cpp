#include "client/kvrctl/Report.h"
#include "platform/codec/JSON.h"
#include "platform/text/Base64.h"

#include <cmath>
#include <cstdio>
#include <utility>

// JSON documents of the answers, for programs.

namespace kvr::client {
namespace {

constexpr std::string_view kVersion = "1";

std::optional<std::string> isoDate(Date date) {
  const double seconds = std::floor(date.secondsSince1970);
  if (!isInCalendar(date)) return std::nullopt;
  const CalendarTime time = calendarTime(static_cast<long long>(seconds));
  char text[64];
  std::snprintf(text, sizeof text, "%04lld-%02d-%02dT%02d:%02d:%02dZ", time.year, time.month, time.day,
                time.hour, time.minute, time.second);
  return text;
}

/// Converts a tree to types that JSON can hold.
Value plain(const Value& tree) {
  switch (tree.kind()) {
    case Value::Kind::Date:
      return Value(isoDate(tree.date()));
    case Value::Kind::Data:
      return Value(base64Encode(tree.data()));
    case Value::Kind::Real:
      return std::isfinite(tree.real()) ? tree : Value();
    case Value::Kind::Array: {
      Value::Array result;
      for (const Value& element : tree.array()) result.push_back(plain(element));
      return result;
    }
    case Value::Kind::Dictionary: {
      Value::Dictionary result;
      for (const auto& [key, value] : tree.dictionary()) result.emplace_hint(result.end(), key, plain(value));
      return result;
    }
    default:
      return tree;
  }
}

/// A document with the version and one other property. It is assembled as text, because the property may
/// already be nested as deep as a document can be.
std::string document(std::string_view name, const std::string& content) {
  return printable("{\"" + std::string(name) + "\":" + content + ",\"version\":" + std::string(kVersion) +
                   "}") +
         "\n";
}

Result<std::string> list(const std::vector<Result<std::string>>& elements) {
  std::string text = "[";
  for (const auto& element : elements) {
    if (!element) return element.error();
    text += (text.size() > 1 ? "," : "") + *element;
  }
  return text + "]";
}

template <class Element, class TreeOf>
Result<std::string> listed(std::string_view name, const std::vector<Element>& elements,
                           const TreeOf& treeOf) {
  std::vector<Result<std::string>> texts;
  texts.reserve(elements.size());
  for (const Element& element : elements) texts.push_back(writeJSON(treeOf(element)));
  const Result<std::string> content = list(texts);
  if (!content) return content.error();
  return document(name, *content);
}

}  // namespace

Value Report::treeOf(const Device& device) const {
  Value::Dictionary tree{{"deviceType", device.deviceType}, {"type", nameOf(device.deviceType)}};
  if (device.name) tree.emplace("name", *device.name);
  if (device.serialNumber) tree.emplace("serialNumber", serial(*device.serialNumber));
  if (device.activationDate) tree.emplace("activationDate", *device.activationDate);
  return plain(tree);
}

Result<std::string> Report::json(std::string_view name, const Value& tree) {
  const Result<std::string> content = writeJSON(plain(tree));
  if (!content) return content.error();
  return document(name, *content);
}

Result<std::string> Report::json(const Device& device) const {
  const Result<std::string> content = writeJSON(treeOf(device));
  if (!content) return content.error();
  return document("device", *content);
}

Value Report::treeOf(const DeviceStatus& status) const {
  const auto& coverage = status.coverage;
  Value::Dictionary tree{{"device", treeOf(status.device)},
                         {"hasFollowUp", status.hasFollowUp},
                         {"isDismissed", status.isDismissed},
                         {"isKnown", coverage.has_value()}};
  if (status.downloaded) tree.emplace("downloadedDate", *status.downloaded);
  if (coverage) {
    tree.emplace("isCovered", coverage->isCovered);
    if (coverage->end) tree.emplace("coverageEndDate", *coverage->end);
    if (coverage->isOfferShown && coverage->offerEnd) tree.emplace("offerEndDate", *coverage->offerEnd);
  }
  return plain(tree);
}

Value Report::treeOf(const FollowUp& followUp) const {
  Value::Dictionary tree{{"hasBadge", followUp.hasBadge}};
  if (followUp.serialNumber) tree.emplace("serialNumber", serial(*followUp.serialNumber));
  if (followUp.title) tree.emplace("title", *followUp.title);
  if (followUp.text) tree.emplace("text", *followUp.text);
  if (followUp.targetBundleIdentifier)
    tree.emplace("targetBundleIdentifier", *followUp.targetBundleIdentifier);
  if (followUp.expirationDate) tree.emplace("expirationDate", *followUp.expirationDate);
  return plain(tree);
}

Result<std::string> Report::json(const std::vector<Device>& devices) const {
  return listed("devices", devices, [this](const Device& device) { return treeOf(device); });
}

Result<std::string> Report::json(const std::vector<DeviceStatus>& statuses) const {
  return listed("statuses", statuses, [this](const DeviceStatus& status) { return treeOf(status); });
}

Result<std::string> Report::json(const std::vector<FollowUp>& followUps) const {
  return listed("followUps", followUps, [this](const FollowUp& followUp) { return treeOf(followUp); });
}

Result<std::string> Report::json(const std::vector<Activity>& activities,
                                 const Circumstances& circumstances) {
  return listed("activities", activities, [&circumstances](const Activity& activity) {
    Value::Dictionary tree{{"identifier", activity.identifier},
                           {"name", nameOf(activity)},
                           {"requiresNetwork", activity.requiresNetwork}};
    if (activity.targetDate) tree.emplace("targetDate", *activity.targetDate);
    if (activity.dueDate) tree.emplace("dueDate", *activity.dueDate);
    if (activity.heldUntil) tree.emplace("heldUntilDate", *activity.heldUntil);
    if (activity.lastResult) tree.emplace("lastResult", *activity.lastResult);
    if (activity.lastEnd) tree.emplace("lastEndedDate", *activity.lastEnd);
    if (activity.isToCome()) tree.emplace("waitsFor", waitsFor(activity, circumstances));
    return plain(tree);
  });
}

Result<std::string> Report::json(const std::vector<DeviceInfo>& infos) const {
  std::vector<Result<std::string>> elements;
  for (const DeviceInfo& info : infos) {
    const Result<std::string> device = writeJSON(treeOf(info.device));
    const Result<std::string> warranty = writeJSON(plain(info.warranty));
    if (!device || !warranty) return device ? warranty.error() : device.error();
    elements.emplace_back("{\"device\":" + *device + ",\"warranty\":" + *warranty + "}");
  }
  const Result<std::string> content = list(elements);
  if (!content) return content.error();
  return document("deviceInfos", *content);
}

}  // namespace kvr::client
