#pragma once

#if __cplusplus < 202002L
#error "The kvragent client library needs C++20: compile with -std=c++20 or later."
#endif

#include "platform/value/Date.h"
#include "platform/value/Error.h"
#include "platform/value/Value.h"

#include <algorithm>
#include <map>
#include <optional>
#include <string>
#include <vector>

namespace kvr::client {

/// An item shown in the follow-up centre.
struct FollowUp {
  std::optional<std::string> serialNumber;  ///< of the device it is about
  std::optional<std::string> title;
  std::optional<std::string> text;
  std::optional<std::string> targetBundleIdentifier;  ///< of the application that shows it
  bool hasBadge = false;
  std::optional<Date> expirationDate;

  static FollowUp from(const Value& entry);
};

/// A background activity.
struct Activity {
  std::string identifier;
  std::optional<Date> targetDate;  ///< it does nothing before this date
  std::optional<Date> dueDate;     ///< when the scheduler runs it
  std::optional<Date> heldUntil;   ///< it was started too often and waits until then
  bool requiresNetwork = false;
  std::optional<std::string> lastResult;  ///< "finished" or "deferred"
  std::optional<Date> lastEnd;            ///< when its last run ended

  /// Whether a run is planned; otherwise it only has a last run.
  bool isToCome() const { return targetDate || dueDate; }
  /// The earliest date at which it can do anything.
  Date date() const {
    return std::max({targetDate.value_or(Date{}), dueDate.value_or(Date{}), heldUntil.value_or(Date{})});
  }
};

/// What the agent's files below the home directory contain. Only reads, and needs no running agent.
///
/// A missing file is an empty answer; an unreadable or damaged one is an error.
class LocalState {
 public:
  /// The home directory of the user by default.
  explicit LocalState(std::string homeDirectory = homeDirectoryOfUser());

  Result<std::vector<FollowUp>> followUps() const;
  /// In order of their dates; those without a planned run come last.
  Result<std::vector<Activity>> activities() const;

  /// When the device's warranty was last downloaded.
  Result<std::optional<Date>> downloadedDate(const std::string& serialNumber) const;
  /// The last download of each device, by the hash of its serial number.
  Result<std::map<std::string, Date>> downloads() const;
  /// Whether the owner has dismissed a follow-up of the device; false if the file cannot be read.
  bool isDismissed(const std::string& serialNumber) const;

  /// HOME, or else from the user database.
  static std::string homeDirectoryOfUser();

 private:
  /// The dictionary in a file, null for a missing file.
  Result<Value> dictionaryIn(const std::string& path) const;

  const std::string homeDirectory_;
};

}  // namespace kvr::client
