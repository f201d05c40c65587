#pragma once

#include "client/LocalState.h"
#include "client/Records.h"
#include "client/kvrctl/Terminal.h"
#include "platform/value/Error.h"

#include <string>
#include <string_view>
#include <vector>

namespace kvr::client {

/// Where one device stands, in all.
struct DeviceStatus {
  Device device;
  std::optional<Coverage> coverage;  ///< nothing when none is known
  bool hasFollowUp = false;          ///< whether its offer is being shown
  bool isDismissed = false;          ///< whether the owner has dismissed it before
  std::optional<Date> downloaded;    ///< when the service was asked last
  Date now;                          ///< what the rest is compared with
};

/// What an activity's run depends on, besides its dates.
struct Circumstances {
  Date now;
  bool isAgentRunning = false;
  bool isNetworkReachable = true;
};

/// What an activity that is to come waits for, in words; empty when it is not to come.
std::string waitsFor(const Activity& activity, const Circumstances& circumstances);

/// A device's type in a word.
const char* nameOf(std::uint64_t deviceType);

/// What a person, or a program, is shown of the agent's answers.
///
/// The text comes from servers and paired devices, so whatever could command a terminal is written as an
/// escape, `\u001b`, in both forms. Serial numbers are shortened to their end unless asked for whole.
class Report {
 public:
  enum class Serials { Shortened, Whole };

  explicit Report(Serials serials) : serials_(serials) {}

  /// A serial number as it is shown.
  std::string serial(const std::string& whole) const;

  // For people, with dates in the user's form and zone: lines of a name and a value, records set apart by an
  // empty line; or a table. Empty when there are none.
  std::string text(const std::vector<Device>& devices) const;
  std::string text(const std::vector<DeviceInfo>& infos) const;
  std::string text(const std::vector<FollowUp>& followUps) const;

  /// Any dictionary, a line an entry.
  static std::string text(const Value& dictionary);
  /// A table of one line an activity.
  static std::string text(const std::vector<Activity>& activities, const Circumstances& circumstances);
  /// A table of one line a device.
  std::string text(const std::vector<DeviceStatus>& statuses, const Style& style) const;

  // For programs: one JSON document on one line, with its format's version under "version". Dates are ISO
  // 8601 in UTC, data is base64; a number that is not finite and a date outside the calendar are null.
  Result<std::string> json(const Device& device) const;
  Result<std::string> json(const std::vector<Device>& devices) const;
  Result<std::string> json(const std::vector<DeviceInfo>& infos) const;
  /// Any tree, under a name.
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
