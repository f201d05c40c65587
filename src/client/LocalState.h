#pragma once

#include "platform/Date.h"
#include "platform/Error.h"
#include "platform/Value.h"

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

/// A background activity that is to come.
struct Activity {
  std::string identifier;
  std::optional<Date> targetDate;  ///< before which it does nothing
  std::optional<Date> dueDate;     ///< when the platform runs it
  bool requiresNetwork = false;
};

/// What the agent's files below the home directory say. Looking changes nothing, and needs no agent.
///
/// A file that is missing is an empty answer; one that cannot be read, or is damaged, an error.
class LocalState {
 public:
  /// The home directory of the user by default.
  explicit LocalState(std::string homeDirectory = homeDirectoryOfUser());

  Result<std::vector<FollowUp>> followUps() const;
  /// In the order in which they come: those with an earlier date first.
  Result<std::vector<Activity>> activities() const;

  /// When the device's warranty was downloaded last.
  Result<std::optional<Date>> downloadedDate(const std::string& serialNumber) const;

  /// HOME, or as the system has it.
  static std::string homeDirectoryOfUser();

 private:
  /// The dictionary in a file, null for a missing file.
  Result<Value> dictionaryIn(const std::string& path) const;

  const std::string homeDirectory_;
};

}  // namespace kvr::client
