#include "client/LocalState.h"

#include "client/AgentClient.h"
#include "platform/codec/PropertyList.h"
#include "platform/names/Names.h"
#include "platform/text/SHA256Hash.h"

#include <pwd.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <system_error>

namespace kvr::client {
namespace {

const std::string kDownloadedDate = std::string("_") + names::kLastUpdatedDate;
constexpr std::int64_t kBadge = 1;  // of the display style

}  // namespace

FollowUp FollowUp::from(const Value& entry) {
  return {entry["userInfo"][names::kFollowUpSerialNumber].stringIfAny(),
          entry["title"].stringIfAny(),
          entry["informativeFooterText"].stringIfAny(),
          entry["targetBundleIdentifier"].stringIfAny(),
          (entry["displayStyle"].asInteger() & kBadge) != 0,
          entry["expirationDate"].dateIfAny()};
}

LocalState::LocalState(std::string homeDirectory) : homeDirectory_(std::move(homeDirectory)) {}

std::string LocalState::homeDirectoryOfUser() {
  if (const char* home = std::getenv("HOME"); home != nullptr && *home != '\0') return home;
  const passwd* const user = ::getpwuid(::getuid());
  return user != nullptr && user->pw_dir != nullptr ? user->pw_dir : "/";
}

Result<Value> LocalState::dictionaryIn(const std::string& path) const {
  const std::string whole = homeDirectory_ + "/" + path;
  std::ifstream file(whole, std::ios::binary);
  if (!file) {
    const int reason = errno;
    if (reason == ENOENT || reason == ENOTDIR) return Value();
    return Error{std::string(kErrorDomain), OtherFailure,
                 whole + " cannot be read: " + std::generic_category().message(reason)};
  }
  const std::string bytes{std::istreambuf_iterator<char>(file), {}};
  auto tree = readPropertyList(bytes);
  if (tree && tree->isDictionary()) return tree;
  return Error{std::string(kErrorDomain), OtherFailure,
               whole + " is damaged: " + (tree ? "it holds no dictionary" : tree.error().message)};
}

Result<std::vector<FollowUp>> LocalState::followUps() const {
  const auto tree = dictionaryIn(names::followUpsFile());
  if (!tree) return tree.error();
  std::vector<FollowUp> followUps;
  if (!(*tree)["items"].isArray()) return followUps;
  for (const auto& entry : (*tree)["items"].array()) followUps.push_back(FollowUp::from(entry));
  return followUps;
}

Result<std::vector<Activity>> LocalState::activities() const {
  const auto registered = dictionaryIn(names::activitiesFile());
  const auto preferences = dictionaryIn(names::preferencesFile());
  if (!registered || !preferences) return registered ? preferences.error() : registered.error();
  std::map<std::string, Activity> activities;
  if (const Value& all = (*registered)["activities"]; all.isDictionary()) {
    for (const auto& [identifier, entry] : all.dictionary()) {
      activities[identifier].dueDate = entry["dueDate"].dateIfAny();
      activities[identifier].heldUntil = entry["heldUntilDate"].dateIfAny();
      activities[identifier].requiresNetwork = entry["requiresNetwork"].asBool();
    }
  }
  if (const Value& runs = (*registered)["lastRuns"]; runs.isDictionary()) {
    for (const auto& [identifier, run] : runs.dictionary()) {
      activities[identifier].lastResult = run["result"].stringIfAny();
      activities[identifier].lastEnd = run["endedDate"].dateIfAny();
    }
  }
  if (preferences->isDictionary()) {
    for (const auto& [key, value] : preferences->dictionary()) {
      constexpr std::string_view kSuffix = names::kTargetDateSuffix;
      if (!key.ends_with(kSuffix)) continue;
      activities[key.substr(0, key.size() - kSuffix.size())].targetDate = value.dateIfAny();
    }
  }
  std::vector<Activity> sorted;
  for (auto& [identifier, activity] : activities) {
    activity.identifier = identifier;
    sorted.push_back(std::move(activity));
  }
  std::ranges::stable_sort(
      sorted, {}, [](const Activity& activity) { return std::pair(!activity.isToCome(), activity.date()); });
  return sorted;
}

Result<std::optional<Date>> LocalState::downloadedDate(const std::string& serialNumber) const {
  const auto preferences = dictionaryIn(names::preferencesFile());
  if (!preferences) return preferences.error();
  return (*preferences)[sha256Hash(serialNumber) + kDownloadedDate].dateIfAny();
}

Result<std::map<std::string, Date>> LocalState::downloads() const {
  const auto preferences = dictionaryIn(names::preferencesFile());
  if (!preferences) return preferences.error();
  std::map<std::string, Date> dates;
  if (!preferences->isDictionary()) return dates;
  for (const auto& [key, value] : preferences->dictionary()) {
    if (!key.ends_with(kDownloadedDate) || !value.isDate()) continue;
    dates.emplace(key.substr(0, key.size() - kDownloadedDate.size()), value.date());
  }
  return dates;
}

bool LocalState::isDismissed(const std::string& serialNumber) const {
  const auto preferences = dictionaryIn(names::preferencesFile());
  return preferences && preferences->contains(sha256Hash(serialNumber) + names::kDismissedSuffix);
}

}  // namespace kvr::client
