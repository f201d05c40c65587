#pragma once

#include "platform/value/Date.h"
#include "platform/value/Error.h"
#include "platform/value/Value.h"

#include <algorithm>
#include <map>
#include <optional>
#include <string>
#include <vector>

namespace kvr::client {

/// An item that the follow-up centre shows.
struct FollowUp {
  std::optional<std::string> serialNumber;  ///< of the device that it is about
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
  std::optional<Date> targetDate;  ///< before which it does nothing
  std::optional<Date> dueDate;     ///< when the platform runs it
  std::optional<Date> heldUntil;   ///< because it was started too often
  bool requiresNetwork = false;
  std::optional<std::string> lastResult;  ///< "finished" or "deferred"
  std::optional<Date> lastEnd;            ///< when its last run ended

  /// Whether it is to come; else it has only run.
  bool isToCome() const { return targetDate || dueDate; }
  /// Before which nothing can be expected of it.
  Date date() const {
    return std::max({targetDate.value_or(Date{}), dueDate.value_or(Date{}), heldUntil.value_or(Date{})});
  }
};

/// What the agent's files below the home directory say. Looking changes nothing, and needs no agent.
///
/// A file that is missing is an empty answer; one that cannot be read, or is damaged, an error.
class LocalState {
 public:
  /// The home directory of the user by default.
  explicit LocalState(std::string homeDirectory = homeDirectoryOfUser());

  Result<std::vector<FollowUp>> followUps() const;
  /// In the order in which they come, those with an earlier date first; then those that have only run.
  Result<std::vector<Activity>> activities() const;

  /// When the device's warranty was downloaded last.
  Result<std::optional<Date>> downloadedDate(const std::string& serialNumber) const;
  /// When each device's was, by the hash under which the agent keeps what it knows of the device.
  Result<std::map<std::string, Date>> downloads() const;
  /// Whether the owner has dismissed a follow-up of the device; an unreadable file says no.
  bool isDismissed(const std::string& serialNumber) const;

  /// HOME, or as the system has it.
  static std::string homeDirectoryOfUser();

 private:
  /// The dictionary in a file, null for a missing file.
  Result<Value> dictionaryIn(const std::string& path) const;

  const std::string homeDirectory_;
};

}  // namespace kvr::client
