#pragma once

#include "client/LocalState.h"
#include "client/Records.h"
#include "client/kvrctl/Terminal.h"
#include "platform/value/Error.h"

#include <string>
#include <string_view>
#include <vector>

namespace kvr::client {

/// Everything known about one device.
struct DeviceStatus {
  Device device;
  std::optional<Coverage> coverage;  ///< nothing when none is known
  bool hasFollowUp = false;          ///< whether its offer is being shown
  bool isDismissed = false;          ///< whether the owner has dismissed one before
  std::optional<Date> downloaded;    ///< the last download
  Date now;                          ///< the date to compare the others with
};

/// What an activity's run depends on, besides its dates.
struct Circumstances {
  Date now;
  bool isAgentRunning = false;
  bool isNetworkReachable = true;
};

/// What a planned activity is waiting for, in words; empty when none is planned.
std::string waitsFor(const Activity& activity, const Circumstances& circumstances);

/// What an activity does, in words; its identifier if it is not one of the agent's.
std::string nameOf(const Activity& activity);

/// A one-word name for a device type.
const char* nameOf(std::uint64_t deviceType);

/// Formats the agent's answers for people and for programs.
///
/// The texts come from servers and paired devices. So characters that could control a terminal are written as
/// escapes, `\u001b`, in both formats. Serial numbers are shortened to their end unless `Serials::Whole`.
class Report {
 public:
  enum class Serials { Shortened, Whole };

  explicit Report(Serials serials) : serials_(serials) {}

  /// A serial number in the form in which it is shown.
  std::string serial(const std::string& whole) const;

  // For people, with dates in the user's format and time zone: lines of name and value, with an empty line
  // between records, or a table. Empty when there are no records.
  std::string text(const std::vector<Device>& devices, const Style& style) const;
  std::string text(const std::vector<DeviceInfo>& infos, const Style& style) const;
  std::string text(const std::vector<FollowUp>& followUps, const Style& style) const;

  /// Any dictionary, one line per entry.
  static std::string text(const Value& dictionary, const Style& style);
  /// A table, one line per activity.
  static std::string text(const std::vector<Activity>& activities, const Circumstances& circumstances,
                          const Style& style);
  /// A table, one line per device.
  std::string text(const std::vector<DeviceStatus>& statuses, const Style& style) const;

  // For programs: one JSON document on one line, with the format's version under "version". Dates are ISO
  // 8601 in UTC, data is base64; a number that is not finite and a date outside the calendar are null.
  Result<std::string> json(const Device& device) const;
  Result<std::string> json(const std::vector<Device>& devices) const;
  Result<std::string> json(const std::vector<DeviceInfo>& infos) const;
  /// Any tree, under the given name.
  static Result<std::string> json(std::string_view name, const Value& tree);
  Result<std::string> json(const std::vector<DeviceStatus>& statuses) const;
  Result<std::string> json(const std::vector<FollowUp>& followUps) const;
  static Result<std::string> json(const std::vector<Activity>& activities,
                                  const Circumstances& circumstances);

 private:
  using Lines = std::vector<std::pair<std::string, std::string>>;

  Lines linesOf(const Device& device) const;
  Value treeOf(const Device& device) const;
  Value treeOf(const DeviceStatus& status) const;
  Value treeOf(const FollowUp& followUp) const;

  const Serials serials_;
};

}  // namespace kvr::client
