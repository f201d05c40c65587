#pragma once

#include "client/LocalState.h"
#include "client/Records.h"
#include "client/Terminal.h"
#include "platform/Error.h"

#include <string>
#include <string_view>
#include <vector>

namespace kvr::client {

/// Where one device stands, in all.
struct DeviceStatus {
  Device device;
  std::optional<Coverage> coverage;  ///< nothing when none is known
  bool hasFollowUp = false;          ///< whether its offer is being shown
  std::optional<Date> downloaded;    ///< when the service was asked last
  Date now;                          ///< what the rest is compared with
};

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

  // For people: lines of a name and a value, records set apart by an empty line.
  std::string text(const std::vector<Device>& devices) const;
  std::string text(const std::vector<DeviceInfo>& infos) const;
  std::string text(const std::vector<FollowUp>& followUps) const;
  std::string text(const std::vector<Activity>& activities) const;

  /// Any dictionary, a line an entry.
  static std::string text(const Value& dictionary);
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
  Result<std::string> json(const std::vector<Activity>& activities) const;

 private:
  using Lines = std::vector<std::pair<std::string, std::string>>;

  Lines linesOf(const Device& device) const;
  Value treeOf(const Device& device) const;
  Value treeOf(const DeviceStatus& status) const;
  Value treeOf(const FollowUp& followUp) const;
  static Value treeOf(const Activity& activity);

  const Serials serials_;
};

/// The text with control characters, and others that change how their surroundings look, as escapes.
std::string printable(std::string_view text);

}  // namespace kvr::client
