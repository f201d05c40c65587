#include "client/kvrctl/Report.h"

#include "client/kvrctl/Table.h"
#include "platform/names/Names.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <utility>

namespace kvr::client {
namespace {

constexpr std::size_t kShownSerialCharacters = 4;
constexpr long long kDaySeconds = 86400;

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
    return date ? std::optional(Style::moment(*date)) : std::nullopt;
  };
  lines.emplace_back("Covered", coverage.isCovered ? "yes" : "no");
  append("Coverage", coverage.label);
  append("Description", coverage.description);
  append("Coverage ends", dateText(coverage.end));
  if (!warranty["zubOfferEligible"].asBool()) return;
  append("Offer", coverage.offerLabel);
  append("Offer ends", dateText(coverage.offerEnd));
}

/// Whole days from one date to another, rounded up; "0" for a date that has passed, empty for one outside the
/// calendar.
std::string daysBetween(Date from, Date until) {
  if (!isInCalendar(until)) return "";
  const double days = std::ceil((until - from) / static_cast<double>(kDaySeconds));
  return std::to_string(std::max(0LL, static_cast<long long>(days)));
}

std::string ageText(double seconds) {
  if (seconds < 0 || !isInCalendar({seconds})) return "";
  const auto whole = static_cast<long long>(seconds);
  if (whole < 60) return "just now";
  if (whole < 3600) return std::to_string(whole / 60) + " min ago";
  if (whole < 2 * kDaySeconds) return std::to_string(whole / 3600) + " h ago";
  return std::to_string(whole / kDaySeconds) + " days ago";
}

/// Whether a date lies in the future.
bool isAhead(const std::optional<Date>& date, Date now) { return date && *date > now; }

std::string shown(const std::vector<std::pair<std::string, std::string>>& lines, const Style& style) {
  std::vector<std::pair<std::string, Cell>> cells;
  cells.reserve(lines.size());
  for (const auto& [name, value] : lines) cells.emplace_back(name, printable(value));
  return paragraph(cells, style);
}

}  // namespace

const char* nameOf(std::uint64_t deviceType) {
  return deviceType == Device::Watch ? "Watch" : deviceType == Device::Other ? "Other" : "Default";
}

std::string nameOf(const Activity& activity) {
  constexpr std::array<std::pair<std::string_view, const char*>, 6> kNames{
      {{names::kPostUpgrade, "After an upgrade"},
       {names::kPostBoot, "After a boot"},
       {names::kOutreach, "Outreach"},
       {names::kConversionOutreach, "Conversion outreach"},
       {names::kFollowUpPost, "Post follow-ups"},
       {names::kFollowUpRefresh, "Update follow-ups"}}};
  const auto* const known =
      std::ranges::find(kNames, activity.identifier, &decltype(kNames)::value_type::first);
  return known == kNames.end() ? activity.identifier : known->second;
}

std::string waitsFor(const Activity& activity, const Circumstances& circumstances) {
  if (!activity.isToCome()) return "";
  if (!activity.dueDate) return "the agent, to register it";
  if (isAhead(activity.targetDate, circumstances.now) || isAhead(activity.dueDate, circumstances.now))
    return "its date";
  if (activity.requiresNetwork && !circumstances.isNetworkReachable) return "the network";
  if (!circumstances.isAgentRunning) return "the agent, to start";
  if (isAhead(activity.heldUntil, circumstances.now))
    return "the limit of starts, until " + Style::moment(*activity.heldUntil);
  return activity.lastResult == "deferred" ? "its next try" : "its turn";
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
              {"Type", nameOf(device.deviceType)}};
  if (device.activationDate) lines.emplace_back("Activated", Style::moment(*device.activationDate));
  return lines;
}

std::string Report::text(const std::vector<Device>& devices, const Style& style) const {
  std::string text;
  for (const Device& device : devices) text += (text.empty() ? "" : "\n") + shown(linesOf(device), style);
  return text;
}

std::string Report::text(const std::vector<DeviceInfo>& infos, const Style& style) const {
  std::string text;
  for (const DeviceInfo& info : infos) {
    Lines lines = linesOf(info.device);
    appendWarranty(lines, info.warranty);
    text += (text.empty() ? "" : "\n") + shown(lines, style);
  }
  return text;
}

std::string Report::text(const std::vector<FollowUp>& followUps, const Style& style) const {
  std::string text;
  for (const FollowUp& followUp : followUps) {
    Lines lines{{"Follow-up", followUp.title.value_or("untitled")},
                {"Serial number", followUp.serialNumber ? serial(*followUp.serialNumber) : "unknown"}};
    if (followUp.text) lines.emplace_back("Text", *followUp.text);
    lines.emplace_back("Shown by", followUp.targetBundleIdentifier.value_or("nobody"));
    lines.emplace_back("Badge", followUp.hasBadge ? "yes" : "no");
    if (followUp.expirationDate) lines.emplace_back("Shown until", Style::moment(*followUp.expirationDate));
    text += (text.empty() ? "" : "\n") + shown(lines, style);
  }
  return text;
}

std::string Report::text(const std::vector<Activity>& activities, const Circumstances& circumstances,
                         const Style& style) {
  Table table({{"Activity", 14}, {"Not before", 0, 1}, {"Due"}, {"Last run", 17, 2}, {"Waits for", 14}});
  const auto dateText = [](const std::optional<Date>& date) { return date ? Style::moment(*date) : ""; };
  for (const Activity& activity : activities) {
    const std::string lastRun = dateText(activity.lastEnd) + (activity.lastEnd ? ", " : "");
    table.add({printable(nameOf(activity)), dateText(activity.targetDate), dateText(activity.dueDate),
               activity.lastResult ? printable(lastRun + *activity.lastResult) : "",
               waitsFor(activity, circumstances)});
  }
  return activities.empty() ? "" : table.text(style);
}

std::string Report::text(const Value& dictionary, const Style& style) {
  Lines lines;
  if (dictionary.isDictionary()) {
    for (const auto& [key, value] : dictionary.dictionary())
      lines.emplace_back(printable(key), describe(value));
  }
  return shown(lines, style);
}

std::string Report::text(const std::vector<DeviceStatus>& statuses, const Style& style) const {
  Table table({{"Device", 14},
               {"Serial", 0, 3},
               {"Coverage", 12},
               {"Until"},
               {"Days left", 0, 2},
               {"Offer until", 0, 5},
               {"Follow-up", 0, 4},
               {"Asked", 0, 1}});
  for (const auto& status : statuses) {
    const auto& coverage = status.coverage;
    const bool isCovered = coverage && coverage->isCovered;
    const auto until = coverage ? coverage->end : std::nullopt;
    const bool isOffered =
        coverage && coverage->isOfferShown && coverage->offerEnd && *coverage->offerEnd > status.now;
    table.add({printable(status.device.name.value_or("unnamed")),
               printable(status.device.serialNumber ? serial(*status.device.serialNumber) : "unknown"),
               {!coverage   ? "unknown"
                : isCovered ? printable(coverage->label.value_or("covered"))
                            : "not covered",
                isCovered ? Style::Good : Style::Bad},
               until ? style.day(*until) : "",
               until ? daysBetween(status.now, *until) : "",
               isOffered ? style.day(*coverage->offerEnd) : "",
               status.hasFollowUp   ? Cell("shown", Style::Notice)
               : status.isDismissed ? "dismissed"
                                    : "",
               status.downloaded ? ageText(status.now - *status.downloaded) : ""});
  }
  return table.text(style);
}

}  // namespace kvr::client
