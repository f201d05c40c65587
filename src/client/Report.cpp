#include "client/Report.h"

#include "platform/Base64.h"
#include "platform/JSON.h"
#include "platform/UTF8.h"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <utility>

namespace kvr::client {
namespace {

constexpr std::string_view kVersion = "1";
constexpr std::size_t kShownSerialCharacters = 4;
constexpr long long kDaySeconds = 86400;
constexpr double kLastCalendarSecond = 1e15;

/// Control characters, line separators, and what reorders text.
bool isUnprintable(char32_t point) {
  return point < 0x20 || (point >= 0x7F && point <= 0x9F) || (point >= 0x2028 && point <= 0x202E) ||
         (point >= 0x2066 && point <= 0x2069) || point == 0x200E || point == 0x200F || point == 0x061C;
}

std::optional<std::string> isoDate(Date date) {
  const double seconds = std::floor(date.secondsSince1970);
  if (!(std::abs(seconds) <= kLastCalendarSecond)) return std::nullopt;
  const CalendarTime time = calendarTime(static_cast<long long>(seconds));
  char text[64];
  std::snprintf(text, sizeof text, "%04lld-%02d-%02dT%02d:%02d:%02dZ", time.year, time.month, time.day,
                time.hour, time.minute, time.second);
  return text;
}

/// The tree as JSON can hold it.
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

const char* nameOfType(std::uint64_t type) {
  return type == Device::Watch ? "Watch" : type == Device::Other ? "Other" : "Default";
}

std::string shown(const std::optional<Date>& date) {
  return date ? isoDate(*date).value_or("unknown") : "unknown";
}

void appendWarranty(std::vector<std::pair<std::string, std::string>>& lines, const Value& warranty) {
  if (warranty.isNull()) {
    lines.emplace_back("Warranty", "none known");
    return;
  }
  const auto coverage = Coverage::from(warranty);
  const auto append = [&lines](const char* name, const std::optional<std::string>& text) {
    if (text) lines.emplace_back(name, *text);
  };
  const auto dateText = [](const std::optional<Date>& date) {
    return date ? std::optional(shown(date)) : std::nullopt;
  };
  lines.emplace_back("Covered", coverage.isCovered ? "yes" : "no");
  append("Coverage", coverage.label);
  append("Description", coverage.description);
  append("Coverage ends", dateText(coverage.end));
  if (!warranty["zubOfferEligible"].asBool()) return;
  append("Offer", coverage.offerLabel);
  append("Offer ends", dateText(coverage.offerEnd));
}

/// Whole days from one date to another, rounded up; "0" for one that has passed.
std::string daysBetween(Date from, Date until) {
  const double days = std::ceil((until - from) / 86400);
  return std::abs(days) < kLastCalendarSecond ? std::to_string(std::max(0LL, static_cast<long long>(days)))
                                              : "";
}

std::string ageText(double seconds) {
  if (!(seconds >= 0) || seconds > kLastCalendarSecond) return "";
  const auto whole = static_cast<long long>(seconds);
  if (whole < 60) return "just now";
  if (whole < 3600) return std::to_string(whole / 60) + " min ago";
  if (whole < 2 * kDaySeconds) return std::to_string(whole / 3600) + " h ago";
  return std::to_string(whole / kDaySeconds) + " days ago";
}

std::string aligned(const std::vector<std::pair<std::string, std::string>>& lines) {
  std::size_t width = 0;
  for (const auto& line : lines) width = std::max(width, line.first.size());
  std::string text;
  for (const auto& [name, value] : lines) {
    text += name + ":" + std::string(width - name.size() + 1, ' ') + printable(value) + "\n";
  }
  return text;
}

/// A document of one property beside the version. The parts are put together as text, because each of them
/// may be nested as deep as a document can.
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

std::string printable(std::string_view text) {
  std::string result;
  for (std::size_t at = 0; at < text.size();) {
    const std::size_t begin = at;
    char32_t point = nextCodePoint(text, at);
    if (point == kNoCodePoint) {
      point = 0xFFFD;
      ++at;
    } else if (!isUnprintable(point)) {
      result += text.substr(begin, at - begin);
      continue;
    }
    char escape[16];
    std::snprintf(escape, sizeof escape, "\\u%04x", static_cast<unsigned>(point));
    result += escape;
  }
  return result;
}

std::string Report::serial(const std::string& whole) const {
  if (serials_ == Serials::Whole || whole.size() <= kShownSerialCharacters) return whole;
  std::size_t begin = whole.size() - kShownSerialCharacters;
  while (begin < whole.size() && (static_cast<unsigned char>(whole[begin]) & 0xC0U) == 0x80) ++begin;
  return "…" + whole.substr(begin);
}

Report::Lines Report::linesOf(const Device& device) const {
  Lines lines{{"Device", device.name.value_or("unnamed")},
              {"Serial number", device.serialNumber ? serial(*device.serialNumber) : "unknown"},
              {"Type", nameOfType(device.deviceType)}};
  if (device.activationDate) lines.emplace_back("Activated", shown(device.activationDate));
  return lines;
}

std::string Report::text(const std::vector<Device>& devices) const {
  std::string text;
  for (const Device& device : devices) text += (text.empty() ? "" : "\n") + aligned(linesOf(device));
  return text;
}

std::string Report::text(const std::vector<DeviceInfo>& infos) const {
  std::string text;
  for (const DeviceInfo& info : infos) {
    Lines lines = linesOf(info.device);
    appendWarranty(lines, info.warranty);
    text += (text.empty() ? "" : "\n") + aligned(lines);
  }
  return text;
}

std::string Report::text(const std::vector<FollowUp>& followUps) const {
  std::string text;
  for (const FollowUp& followUp : followUps) {
    Lines lines{{"Follow-up", followUp.title.value_or("untitled")},
                {"Serial number", followUp.serialNumber ? serial(*followUp.serialNumber) : "unknown"}};
    if (followUp.text) lines.emplace_back("Text", *followUp.text);
    lines.emplace_back("Shown by", followUp.targetBundleIdentifier.value_or("nobody"));
    lines.emplace_back("Badge", followUp.hasBadge ? "yes" : "no");
    if (followUp.expirationDate) lines.emplace_back("Shown until", shown(followUp.expirationDate));
    text += (text.empty() ? "" : "\n") + aligned(lines);
  }
  return text;
}

std::string Report::text(const std::vector<Activity>& activities) const {
  std::string text;
  for (const Activity& activity : activities) {
    Lines lines{{"Activity", activity.identifier}};
    if (activity.targetDate) lines.emplace_back("Not before", shown(activity.targetDate));
    if (activity.dueDate) lines.emplace_back("Due", shown(activity.dueDate));
    lines.emplace_back("Network", activity.requiresNetwork ? "needed" : "not needed");
    text += (text.empty() ? "" : "\n") + aligned(lines);
  }
  return text;
}

Value Report::treeOf(const Device& device) const {
  Value::Dictionary tree{{"deviceType", device.deviceType}, {"type", nameOfType(device.deviceType)}};
  if (device.name) tree.emplace("name", *device.name);
  if (device.serialNumber) tree.emplace("serialNumber", serial(*device.serialNumber));
  if (device.activationDate) tree.emplace("activationDate", *device.activationDate);
  return plain(tree);
}

std::string Report::text(const Value& dictionary) {
  Lines lines;
  if (dictionary.isDictionary()) {
    for (const auto& [key, value] : dictionary.dictionary())
      lines.emplace_back(printable(key), describe(value));
  }
  return aligned(lines);
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
  const auto& [device, coverage, hasFollowUp, downloaded, now] = status;
  Value::Dictionary tree{
      {"device", treeOf(device)}, {"hasFollowUp", hasFollowUp}, {"isKnown", coverage.has_value()}};
  if (downloaded) tree.emplace("downloadedDate", *downloaded);
  if (coverage) {
    tree.emplace("isCovered", coverage->isCovered);
    if (coverage->end) tree.emplace("coverageEndDate", *coverage->end);
    if (coverage->isOfferShown && coverage->offerEnd) tree.emplace("offerEndDate", *coverage->offerEnd);
  }
  return plain(tree);
}

std::string Report::text(const std::vector<DeviceStatus>& statuses, const Style& style) const {
  Table table({"Device", "Serial", "Coverage", "Until", "Days left", "Offer until", "Follow-up", "Asked"});
  for (const auto& status : statuses) {
    const auto& coverage = status.coverage;
    const bool isCovered = coverage && coverage->isCovered;
    const auto until = coverage ? coverage->end : std::nullopt;
    const bool isOffered =
        coverage && coverage->isOfferShown && coverage->offerEnd && *coverage->offerEnd > status.now;
    table.add({printable(status.device.name.value_or("unnamed")),
               printable(status.device.serialNumber ? serial(*status.device.serialNumber) : "unknown"),
               style.paint(isCovered ? Style::Good : Style::Bad,
                           !coverage   ? "unknown"
                           : isCovered ? printable(coverage->label.value_or("covered"))
                                       : "not covered"),
               until ? style.day(*until) : "", until ? daysBetween(status.now, *until) : "",
               isOffered ? style.day(*coverage->offerEnd) : "",
               status.hasFollowUp ? style.paint(Style::Notice, "shown") : "",
               status.downloaded ? ageText(status.now - *status.downloaded) : ""});
  }
  return table.text();
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

Value Report::treeOf(const Activity& activity) {
  Value::Dictionary tree{{"identifier", activity.identifier}, {"requiresNetwork", activity.requiresNetwork}};
  if (activity.targetDate) tree.emplace("targetDate", *activity.targetDate);
  if (activity.dueDate) tree.emplace("dueDate", *activity.dueDate);
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

Result<std::string> Report::json(const std::vector<Activity>& activities) const {
  return listed("activities", activities, [](const Activity& activity) { return treeOf(activity); });
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
