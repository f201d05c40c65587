// Files, preferences and follow-ups.

#include "core/followup/FollowUpKeys.h"
#include "core/scheduling/SchedulingKeys.h"
#include "core/warranty/WarrantyKeys.h"
#include "kvr-simulate/Invariants.h"
#include "platform/names/Names.h"
#include "platform/text/SHA256Hash.h"

#include <algorithm>

namespace kvr::simulate {
namespace {

const std::string kPreferencesPath =
    std::string(SimulatedFiles::kHomeDirectory) + "/Library/Preferences/com.tarsil.kvragent.plist";
const std::string kFollowUpsPath =
    std::string(SimulatedFiles::kHomeDirectory) + "/Library/FollowUps/" + names::kFollowUpClient + ".plist";

constexpr std::string_view kTemporaryTag = ".kvr-";

Value::Array listIn(const Value& value) { return value.isArray() ? value.array() : Value::Array(); }

/// The keys whose values differ, in ascending order; `after` is a dictionary.
std::vector<std::string> changedKeys(const Value& before, const Value& after) {
  static const Value::Dictionary kNone;
  const auto& earlier = before.isDictionary() ? before.dictionary() : kNone;
  std::vector<std::string> keys;
  const auto compare = [&keys](const std::string& key, const Value& left, const Value& right) {
    if (!(left == right)) keys.push_back(key);
  };
  auto old = earlier.begin();
  for (const auto& [key, value] : after.dictionary()) {
    for (; old != earlier.end() && old->first < key; ++old) compare(old->first, old->second, {});
    const bool isKept = old != earlier.end() && old->first == key;
    compare(key, isKept ? old++->second : Value(), value);
  }
  for (; old != earlier.end(); ++old) compare(old->first, old->second, {});
  return keys;
}

bool mayBeRemoved(const std::string& key) {
  return key == preference::kServerVersionCache || key == names::kLastUpdatedDate ||
         key == preference::kCachedWarrantyLocale || key == preference::kCachedWarrantyVersion;
}

}  // namespace

bool isWithoutWatches(const Value& serverVersion) {
  return !serverVersion.isNull() && serverVersion[preference::kHighServerVersion].asInteger() < 3;
}

Value Invariants::preferences() const { return platform_->files.getPropertyList(kPreferencesPath); }

void Invariants::readFilesAgain() {
  if (platform_ == nullptr) return;
  preferences_ = preferences();
  durable_.clear();
  readCaches();
}

void Invariants::checkNames(const std::string& path) {
  for (const auto& serialNumber : world_.serialNumbers()) {
    if (path.find(serialNumber) != std::string::npos) report("no serial number names anything", path);
  }
  if (path.find(".damaged-") != std::string::npos && !damageIsPlanted_) report("no file is damaged", path);
}

void Invariants::fileChanged(const std::string& path, bool isDone) {
  if (platform_ == nullptr) return;
  const auto bytes = platform_->files.get(path);
  if (isDone && bytes) {
    durable_.insert_or_assign(path, *bytes);
  } else {
    durable_.erase(path);
  }
  cacheChanged(path);
  if (!isWatching()) return;
  checkNames(path);
  if (bytes && path.ends_with(".plist") && !damageIsPlanted_ && !platform_->files.holdsPropertyList(path)) {
    report("files are whole", path);
  }
  // Leftovers of an earlier process are removed before the first file of a directory is replaced.
  if (!platform_->files.changing().empty()) return checkContents(path);
  const bool isCleared = isDone && bytes && path.find(".damaged-") == std::string::npos && !filesFailed_;
  for (const auto& neighbour : platform_->files.list(path.substr(0, path.rfind('/')), kTemporaryTag)) {
    if (isCleared || !leftovers_.contains(neighbour)) report("no temporary file stays", neighbour);
  }
  checkContents(path);
}

void Invariants::checkContents(const std::string& path) {
  if (path == kPreferencesPath) checkPreferences();
  if (path == kFollowUpsPath) checkFollowUps();
}

// Preferences.

void Invariants::checkPreferences() {
  const auto before = std::exchange(preferences_, preferences());
  const auto& after = preferences_;
  if (!after.isDictionary()) {
    if (!damageIsPlanted_) report("preferences are never lost", "all of them");
    datesAreDamaged_ = true;
    return;
  }
  // The preferences about one device's cached warranty change together.
  std::set<std::string> changed;
  for (const auto& key : changedKeys(before, after)) {
    changed.insert(key.substr(0, key.find("_CachedWarranty")));
    checkChange(key, before[key], after[key], after);
  }
  if (changed.size() > 1) {
    report("preferences are never lost", std::to_string(changed.size()) + " changed at once");
  }
}

void Invariants::checkChange(const std::string& key, const Value& before, const Value& after,
                             const Value& tree) {
  for (const auto& serialNumber : world_.serialNumbers()) {
    if (key.find(serialNumber) != std::string::npos) report("no serial number names anything", key);
  }
  if (key == preference::kFollowUpPostedHashes) return checkPostedList(before, after, tree);
  if (key == preference::kFollowUpDismissedHashes) {
    const auto earlier = listIn(before);
    const auto later = listIn(after);
    if (later.size() < earlier.size() || !std::equal(earlier.begin(), earlier.end(), later.begin())) {
      report("dismissals are never forgotten", describe(before) + " became " + describe(after));
    }
  }
  if (key == preference::kConversionOutreachScheduledDate && !after.isNull()) checkConversionDate(after);
  if (key == preference::kServerVersionCache && isWithoutWatches(before)) trouble();
  if (key.ends_with(std::string("_") + names::kLastUpdatedDate)) downloaded(key);
  // A post run schedules the refresh for the items it looked up, instead of the one that others wait for.
  const auto refreshDate = std::string(names::kFollowUpRefresh) + names::kTargetDateSuffix;
  if (key == refreshDate && runs_.contains(names::kFollowUpPost)) refreshed_.clear();
  if (!after.isNull() || mayBeRemoved(key)) return;
  if (key.ends_with(names::kTargetDateSuffix)) {
    checkTargetDateRemoval(key.substr(0, key.size() - std::string_view(names::kTargetDateSuffix).size()),
                           before);
  } else {
    report("preferences are never lost", key);
  }
}

/// A target date is removed at the end of the run that was started for it; the very first run after an
/// upgrade removes all of them.
void Invariants::checkTargetDateRemoval(const std::string& activity, const Value& before) {
  const auto upgrade = runs_.find(names::kPostUpgrade);
  if (upgrade != runs_.end() && upgrade->second.isFirstUpgrade) return;
  const auto run = runs_.find(activity);
  if (run != runs_.end() && run->second.startedFor == before) {
    run->second.removedDate = true;
  } else {
    report("target dates are never lost", activity + ": " + describe(before));
  }
}

/// A device is only removed from the list by an offer that begins anew after the dismissal.
void Invariants::checkPostedList(const Value& before, const Value& after, const Value& tree) {
  const auto later = listIn(after);
  std::set<std::string> seen;
  for (const auto& hash : later) {
    if (!seen.insert(hash.string()).second) report("what is posted is remembered", "twice");
  }
  for (const auto& hash : listIn(before)) {
    if (seen.contains(hash.string())) continue;
    if (tree[hash.string() + names::kDismissedSuffix].isNull()) {
      report("what is posted is remembered", hash.string() + " was forgotten");
    }
  }
}

// Follow-ups.

void Invariants::checkFollowUps() {
  std::set<std::string> serialNumbers;
  for (const auto& item : pendingItems()) {
    const auto found = item.userInfo.find(names::kFollowUpSerialNumber);
    if (found == item.userInfo.end()) continue;
    if (!serialNumbers.insert(found->second.string()).second) {
      report("no follow-up is posted twice", found->second.string());
    }
  }
}

/// An expired item that could not be removed from the file is shown again when the clock is set back. It is
/// not refreshed until the next start.
void Invariants::rememberExpired() {
  if (platform_ == nullptr) return;
  for (const auto& entry : listIn(platform_->files.getPropertyList(kFollowUpsPath)["items"])) {
    const auto expires = entry["expirationDate"].dateIfAny();
    if (expires && *expires <= platform_->clock.now()) expired_.insert(entry["uniqueIdentifier"].string());
  }
}

bool Invariants::posting(const FollowUpItem& item, const std::vector<FollowUpItem>& pending) {
  const auto isPending = [&](const std::string& identifier) {
    return std::ranges::any_of(
        pending, [&](const FollowUpItem& other) { return other.uniqueIdentifier == identifier; });
  };
  const bool isMigrated = isPending(names::kFollowUpClient);
  const bool wasPending = isMigrated || isPending(item.uniqueIdentifier.value_or(""));
  if (!isWatching()) return wasPending;
  const auto now = platform_->clock.now();
  const auto serial = item.userInfo.find(names::kFollowUpSerialNumber);
  auto* const offer = world_.service.find(item.title);
  if (serial == item.userInfo.end() || offer == nullptr || offer->lastServed < 0) {
    report("follow-ups are made from what the service said", describe(item.title));
    return wasPending;
  }
  const auto hash = sha256Hash(serial->second.string());
  if (offer->serialNumber != serial->second.string() ||
      item.uniqueIdentifier != std::string(names::kFollowUpClient) + "." + hash) {
    report("follow-ups are made from what the service said", "another device's");
  }
  // An item posted by an earlier version stays, whatever its contents.
  if (isMigrated) return true;
  if (!offer->isOffered) report("nothing is posted that is not offered", describe(item.title));
  if (!(offer->end() > now)) {
    report("nothing is posted after its eligibility", describe(item.title));
  }
  if (!wasPending) checkNewPost(*offer, describe(item.title), now);
  return wasPending;
}

/// New follow-ups come only from the post activity, which downloads in every run.
void Invariants::checkNewPost(const Offer& offer, const std::string& name, Date now) {
  const auto stored = preferences();
  const auto due = offer.postDate(activationOf(offer.serialNumber, stored));
  if (due && *due > now) {
    report("nothing is posted before its date", name + ", due at " + describe(*due));
  }
  const auto run = runs_.find(names::kFollowUpPost);
  if (run == runs_.end() || offer.lastServed < run->second.began) {
    report("what is posted was asked for anew", name);
  }
  if (isDismissed(offer, stored)) report("what is dismissed stays dismissed", name);
}

void Invariants::posted(const FollowUpItem& item, bool wasPending, bool isDone) {
  if (!isWatching() || !isDone) {
    // The post is not tried again before the next refresh; if the process was cut off, it may have succeeded.
    refreshed_.erase(*item.uniqueIdentifier);
    return;
  }
  expired_.erase(*item.uniqueIdentifier);
  ++figures.posts;
  if (runs_.contains(names::kFollowUpRefresh)) {
    refreshed_[*item.uniqueIdentifier] = world_.now;
  } else {
    refreshed_.erase(*item.uniqueIdentifier);
  }
  if (wasPending) return;
  toBeListed_.insert_or_assign(sha256Hash(item.userInfo.at(names::kFollowUpSerialNumber).string()),
                               world_.now);
}

void Invariants::clearing(const std::vector<std::string>& uniqueIdentifiers,
                          const std::vector<FollowUpItem>& pending) {
  if (!isWatching()) return;
  for (const auto& item : pending) {
    if (std::ranges::find(uniqueIdentifiers, item.uniqueIdentifier) == uniqueIdentifiers.end()) continue;
    const auto serial = item.userInfo.find(names::kFollowUpSerialNumber);
    if (serial == item.userInfo.end()) continue;
    checkCleared(serial->second.string());
    // When the process ends, downloads fail, and no follow-up may be cleared because of that. A dismissal and
    // the refresh activity do not download.
    if (endDismisses_ && !endDismisses_->contains(serial->second.string()) &&
        !runs_.contains(names::kFollowUpRefresh)) {
      report("the end takes no follow-up away", describe(item.title));
    }
  }
}

}  // namespace kvr::simulate
