// Processes, runs, requests and the final state.

#include "kvr-simulate/Invariants.h"

#include "core/followup/FollowUpKeys.h"
#include "core/scheduling/SchedulingKeys.h"
#include "platform/names/Names.h"
#include "platform/text/SHA256Hash.h"
#include "platform/text/URL.h"

#include <algorithm>
#include <cmath>

namespace kvr::simulate {
namespace {

constexpr double kHour = 3600;
constexpr double kSlack = 3 * kHour;  ///< for retries and the like
constexpr double kQuiet = 200;        ///< seconds after which requests belong to other downloads
constexpr std::size_t kAttempts = 3;
constexpr double kMostDays = 4294967295;  ///< the most that the agent counts

/// The number in "1,234 days left".
double daysIn(const Value& text) {
  std::string digits = text.stringIfAny().value_or("");
  std::erase(digits, ',');
  return Value(digits).asDouble();
}

}  // namespace

void Figures::add(const Figures& other) {
  starts += other.starts;
  crashes += other.crashes;
  powerLosses += other.powerLosses;
  calls += other.calls;
  requests += other.requests;
  posts += other.posts;
  clockJumps += other.clockJumps;
  fileFaults += other.fileFaults;
  runs += other.runs;
  pauses += other.pauses;
}

void Invariants::report(const std::string& invariant, const std::string& detail) {
  if (!breach_) breach_ = Breach{invariant, detail};
}

void Invariants::beginProcess(SimulatedPlatform& platform) {
  ++figures.starts;
  platform_ = &platform;
  runs_.clear();
  toBeListed_.clear();
  filesFailed_ = filesFail_;
  excuseRuns();
  begun_.clear();
  dismissed_.clear();
  answered_.clear();
  endDismisses_.reset();
  expired_.clear();
  lastRequest_ = -1e9;
  leftovers_.clear();
  for (const auto& path : platform.files.list("")) {
    leftovers_.insert(path);
    checkNames(path);
    const bool isList = path.ends_with(".plist") && path.find("/.") == std::string::npos;
    if (isList && !damageIsPlanted_ && !platform.files.holdsPropertyList(path)) {
      report("files are whole after a crash", path);
    }
  }
  for (const auto& [path, bytes] : durable_) {
    if (!damageIsPlanted_ && platform.files.get(path) != bytes) {
      report("what was stored outlives a crash", path);
    }
  }
  readFilesAgain();
  conversionAtStart_ = preferences_[std::string(names::kConversionOutreach) + names::kTargetDateSuffix];
}

void Invariants::endProcess() {
  if (platform_ == nullptr) return;
  figures.pauses += platform_->queues.pauses();
  for (const auto& path : platform_->files.changing()) durable_.erase(path);
  reportFaults();
  platform_ = nullptr;
}

void Invariants::reportFaults() {
  for (const auto& fault : platform_->faults()) {
    const bool isDeadlock = fault.find("deadlock") != std::string::npos;
    report(isDeadlock ? "no two wait for each other" : "completions are answered once", fault);
  }
}

void Invariants::step() {
  if (!isWatching()) return;
  reportFaults();
  checkListed();
  checkDismissed();
}

/// Once time has passed, what was posted before is recorded.
void Invariants::checkListed() {
  if (toBeListed_.empty()) return;
  const auto list = preferences()[preference::kFollowUpPostedHashes];
  std::erase_if(toBeListed_, [&](const auto& posted) {
    if (posted.second == world_.now) return false;
    const bool isListed =
        list.isArray() && std::ranges::find(list.array(), Value(posted.first)) != list.array().end();
    if (!isListed && !filesFail_) report("what is posted is remembered", posted.first);
    return true;
  });
}

/// Once time has passed, a follow-up whose dismissal was answered is gone, unless its offer has begun again.
/// Whoever saw the follow-up before the dismissal must not have brought it back.
void Invariants::checkDismissed() {
  std::erase_if(answered_, [this](const auto& answered) {
    if (answered.second == world_.now) return false;
    const auto stored = preferences();
    for (const auto& item : pendingItems()) {
      const auto* const offer = world_.service.find(item.title);
      const auto found = item.userInfo.find(names::kFollowUpSerialNumber);
      if (offer == nullptr || found == item.userInfo.end() || found->second != Value(answered.first))
        continue;
      if (isDismissed(*offer, stored) && !filesFailed_) {
        report("what is dismissed stays dismissed", "it is still shown: " + describe(item.title));
      }
    }
    return true;
  });
}

/// Start-up offers the service as its last step.
bool Invariants::isStartingUp() const { return !platform_->services.isListening(names::kAgent); }

// Runs.

void Invariants::runBegins(const std::string& activity) {
  if (!isWatching()) return;
  ++figures.runs;
  if (runs_.contains(activity)) report("an activity never runs twice at once", activity);
  if (isStartingUp()) report("start-up is alone", activity + " runs meanwhile");
  if (activity == names::kPostBoot && begun_.contains(names::kPostUpgrade)) {
    report("post-boot comes before post-upgrade", "it came after");
  }
  begun_.insert(activity);
  Run run;
  run.startedFor = platform_->preferences.objectForKey(activity + names::kTargetDateSuffix);
  run.started = platform_->clock.now();
  run.began = world_.now;
  run.isFirstUpgrade = activity == names::kPostUpgrade &&
                       !platform_->preferences.boolForKey(preference::kPostUpgradeActivityCompleted);
  runs_.insert_or_assign(activity, run);
  auto& times = runTimes_[activity];
  times.push_back(world_.now);
  while (times.front() < world_.now - kHour) times.pop_front();
  const std::size_t most = shortestDay < 86400 ? 75 : 12;
  if (times.size() > most) {
    report("no activity spins", activity + ": " + std::to_string(times.size()) + " runs within an hour");
  }
}

void Invariants::runEnds(const std::string& activity, ActivityResult result) {
  const auto found = runs_.find(activity);
  if (!isWatching() || found == runs_.end()) return;
  const Run run = found->second;
  runs_.erase(found);
  const auto target = run.startedFor.dateIfAny();
  if (result == ActivityResult::Finished && target && *target > run.started) {
    report("nothing runs before its date", activity + " ran before " + describe(*target));
  }
  if (result == ActivityResult::Deferred && run.removedDate) {
    report("target dates are never lost", activity + " was deferred without its date");
  }
}

// Requests.

void Invariants::requested(const HTTPRequest& request, bool isCoverage) {
  if (!isWatching()) return;
  ++figures.requests;
  const auto authority = request.url.find("//");
  const auto host =
      authority == std::string::npos
          ? request.url
          : request.url.substr(authority + 2, request.url.find('/', authority + 2) - authority - 2);
  if (std::ranges::find(world_.hosts, host) == world_.hosts.end()) {
    report("only configured hosts are asked", request.url);
  }
  if (world_.now - lastRequest_ > kQuiet) {
    versionRequests_ = coverageRequests_ = 0;
    everyAnswerRefused_ = true;
  }
  lastRequest_ = world_.now;
  ++(isCoverage ? coverageRequests_ : versionRequests_);
  if (everyAnswerRefused_ && coverageRequests_ > kAttempts * versionRequests_) {
    report("a refused download is tried three times at most",
           std::to_string(coverageRequests_) + " requests of " + std::to_string(versionRequests_) +
               " downloads");
  }
}

void Invariants::coverageAnswered(int status) {
  lastRequest_ = world_.now;
  if (status != 401) everyAnswerRefused_ = false;
}

void Invariants::clockMoved() {
  clockMoved_ = world_.now;
  rememberExpired();
  excuseRuns();
}

void Invariants::suspended(double seconds) {
  lastRequest_ += seconds;
  excuseRuns();
}

// Calm.

void Invariants::checkCalm() {
  if (!isWatching()) return;
  const auto stored = preferences();
  const auto registered = platform_->files.getPropertyList(platform_->files.homeDirectory() +
                                                           "/Library/Activities/com.tarsil.kvragent.plist");
  for (const auto& [activity, run] : runs_) {
    if (run.began < world_.now - kSlack) report("runs come to an end", activity);
  }
  if (filesFailed_) return;
  if (!stored[preference::kPostUpgradeActivityCompleted].asBool()) {
    report("no agent is dormant", "the post-upgrade activity has not run");
  }
  checkOverdue(stored, registered["activities"]);
  checkShown(stored, registered["activities"]);
}

void Invariants::checkOverdue(const Value& stored, const Value& registrations) {
  if (!stored.isDictionary()) return;
  const auto now = platform_->clock.now();
  for (const auto& [key, value] : stored.dictionary()) {
    if (!key.ends_with(names::kTargetDateSuffix)) continue;
    const auto activity = key.substr(0, key.size() - std::string_view(names::kTargetDateSuffix).size());
    const auto& registration = registrations[activity];
    if (runs_.contains(activity)) continue;
    if (registration.isNull()) {
      report("what has a date is going to run", activity + " is not registered");
      continue;
    }
    const Date due = registration["dueDate"].date();
    const Date earliest = std::max(value.date(), registration["registeredDate"].date());
    if (due > earliest + registration["gracePeriod"].asDouble() + 5) {
      report("what has a date is going to run", activity + " is registered for a later date");
    }
    if (now > std::max(due, value.date()) + kSlack) {
      report("what has a date is going to run", activity + " was due at " + describe(due));
    }
  }
}

void Invariants::checkShown(const Value& stored, const Value& registrations) {
  const auto pending = pendingItems();
  const auto refresh = stored[std::string(names::kFollowUpRefresh) + names::kTargetDateSuffix].dateIfAny();
  if (refresh) datesAreDamaged_ = false;
  // The first run after an upgrade removes the date, but the registration stays.
  const bool isToCome = refresh || registrations.contains(names::kFollowUpRefresh) ||
                        runs_.contains(names::kFollowUpRefresh) || runs_.contains(names::kFollowUpPost);
  const bool isAnyRefreshed = std::ranges::any_of(pending, [this](const FollowUpItem& item) {
    // An item that an earlier version posted and that could not be migrated belongs to no device.
    return item.userInfo.contains(names::kFollowUpSerialNumber) && !expired_.contains(*item.uniqueIdentifier);
  });
  if (isAnyRefreshed && !isToCome && !datesAreDamaged_) {
    report("what is shown is kept up to date", "no refresh is to come");
  }
  // A refresh may be late by its grace period.
  if (shortestDay < 86400 || !refresh || *refresh <= platform_->clock.now()) return;
  for (const auto& item : pending) {
    const auto posted = refreshed_.find(*item.uniqueIdentifier);
    auto* const offer = world_.service.find(item.title);
    if (posted == refreshed_.end() || posted->second < clockMoved_ || offer == nullptr) continue;
    const auto activation = activationOf(offer->serialNumber, stored);
    // An item posted while the clock was set differently counts as not shown until its date comes again.
    if (std::max(activation, offer->displayed()) > platform_->clock.now()) continue;
    const double left = std::min(std::ceil((*offer->end() - platform_->clock.now()) / 86400), kMostDays);
    const double shown = std::max(daysIn(item.informativeFooterText), 1.0);
    if (std::abs(shown - std::max(left, 1.0)) > 1) {
      report("what is shown is kept up to date",
             "\"" + item.informativeFooterText.string() + "\" with " + std::to_string(left) + " to go");
    }
  }
}

// The final state.

void Invariants::checkRest(Date postedAt) {
  if (!isWatching()) return;
  const auto pending = pendingItems();
  const auto tracked = world_.trackedSerialNumbers();
  for (const auto& item : pending) {
    const auto found = item.userInfo.find(names::kFollowUpSerialNumber);
    if (found == item.userInfo.end() || std::ranges::find(tracked, found->second.string()) == tracked.end()) {
      report("the end state is right", "a follow-up of a device that is not there");
    }
  }
  for (const auto& serialNumber : tracked) checkDevice(serialNumber, pending, postedAt);
}

void Invariants::checkDevice(const std::string& serialNumber, const std::vector<FollowUpItem>& pending,
                             Date postedAt) {
  const auto number = world_.service.currentOf(serialNumber);
  const Offer& offer = world_.service.at(number);
  const auto now = platform_->clock.now();
  const auto found = std::ranges::find_if(pending, [&](const FollowUpItem& item) {
    return item.userInfo.contains(names::kFollowUpSerialNumber) &&
           item.userInfo.at(names::kFollowUpSerialNumber) == Value(serialNumber);
  });
  if (!offer.isOpen(now)) {
    if (found != pending.end()) report("the end state is right", "a follow-up of an offer that has ended");
    return;
  }
  if (found != pending.end()) {
    if (found->title != Service::labelOf(number)) {
      report("the end state is right", "a follow-up of an earlier offer");
    }
    return;
  }
  const auto stored = preferences();
  const bool isFree = !isDismissed(offer, stored);
  const auto* const watch = world_.watch(serialNumber);
  const auto due = offer.postDate(watch != nullptr ? watch->paired : activationOf(serialNumber, stored));
  if (isFree && (!due || *due <= postedAt)) {
    report("the end state is right",
           "no follow-up of an open offer, due at " + (due ? describe(*due) : std::string("any time")));
  }
}

/// A dismissal holds until the offer begins anew. If a crash prevented its date from being stored, it holds
/// for good.
bool Invariants::isDismissed(const Offer& offer, const Value& stored) const {
  const Value hash = sha256Hash(offer.serialNumber);
  const auto& list = stored[preference::kFollowUpDismissedHashes];
  if (!list.isArray() || std::ranges::find(list.array(), hash) == list.array().end()) return false;
  const auto when = stored[hash.string() + names::kDismissedSuffix].dateIfAny();
  return !when || !offer.displayed() || *when >= *offer.displayed();
}

/// The earliest activation date that the agent may use while a watch is being paired again.
std::optional<Date> Invariants::activationOf(const std::string& serialNumber, const Value& stored) const {
  if (serialNumber == world_.phone) return stored["DefaultDeviceActivationDate"].dateIfAny();
  const auto* const watch = world_.watch(serialNumber);
  return watch == nullptr ? std::nullopt : std::optional(std::min(watch->paired, watch->pairedBefore));
}

std::vector<FollowUpItem> Invariants::pendingItems() const {
  auto items = platform_->followUps.newClient(names::kFollowUpClient)->pendingItems();
  return items ? *std::move(items) : std::vector<FollowUpItem>();
}

}  // namespace kvr::simulate
