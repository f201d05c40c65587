#include "platform/stores/ActivityTable.h"

#include <algorithm>
#include <cmath>
#include <utility>

namespace kvr {
namespace {

constexpr const char* kActivities = "activities";
constexpr const char* kBootIdentifier = "bootIdentifier";
constexpr const char* kOSVersion = "OSVersion";
constexpr const char* kLastRuns = "lastRuns";

constexpr const char* kDelay = "delay";
constexpr const char* kGracePeriod = "gracePeriod";
constexpr const char* kRequiresNetwork = "requiresNetwork";
constexpr const char* kPriority = "priority";
constexpr const char* kRegisteredDate = "registeredDate";
constexpr const char* kDueDate = "dueDate";
constexpr const char* kHeldUntilDate = "heldUntilDate";

constexpr const char* kResult = "result";
constexpr const char* kEndedDate = "endedDate";

/// How long ago, in seconds, a date may have passed while its run was being deferred, and still count.
constexpr double kJustPassed = 1;

/// Allowed difference in seconds between a stored date and its registration, which has whole seconds and is
/// made slightly later.
constexpr double kRounding = 2;

/// The one priority at which activities run.
constexpr const char* kUtility = "utility";

bool isUsableDate(const Value& value) {
  return value.isDate() && std::isfinite(value.date().secondsSince1970);
}

bool isRegistration(const Value& value) {
  return value[kDelay].isNumber() && value[kGracePeriod].isNumber() && value[kRequiresNetwork].isBool() &&
         isUsableDate(value[kRegisteredDate]) && isUsableDate(value[kDueDate]);
}

/// `count` seconds; a negative count is 0.
double seconds(std::int64_t count) { return static_cast<double>(std::max<std::int64_t>(count, 0)); }

}  // namespace

std::optional<Error> ActivityTable::complaintAbout(const Value& tree) {
  const Value& activities = tree[kActivities];
  if (activities.isNull()) return std::nullopt;
  if (!activities.isDictionary()) return Error{"activities", 0, "the activities are not a dictionary"};
  for (const auto& [identifier, registration] : activities.dictionary()) {
    if (!isRegistration(registration)) {
      return Error{"activities", 0, "activity " + identifier + " is no registration"};
    }
  }
  return std::nullopt;
}

void ActivityTable::adopt(const Value& tree) {
  if (!tree.isDictionary()) return;
  Value::Dictionary records = tree.dictionary();
  const Value& activities = tree[kActivities];
  records.erase(kActivities);
  records_.merge(records);
  if (!activities.isDictionary()) return;
  for (const auto& [identifier, value] : activities.dictionary()) {
    Entry& entry = entries_[identifier];
    if (entry.registration) continue;
    entry.registration = Registration{
        {value[kDelay].asInteger(), value[kGracePeriod].asInteger(), value[kRequiresNetwork].asBool()},
        value[kRegisteredDate].date(),
        value[kDueDate].date(),
        RegistrationCause::Demand,
        std::nullopt};
    entry.registrationNumber = ++lastNumber_;
  }
}

Value ActivityTable::tree() const {
  Value::Dictionary activities;
  for (const auto& [identifier, entry] : entries_) {
    if (!entry.registration) continue;
    const auto& [criteria, registered, due, cause, heldUntil] = *entry.registration;
    Value::Dictionary registration{{kDelay, criteria.delay},
                                   {kGracePeriod, criteria.gracePeriod},
                                   {kRequiresNetwork, criteria.requiresNetwork},
                                   {kPriority, kUtility},
                                   {kRegisteredDate, registered},
                                   {kDueDate, due}};
    if (heldUntil) registration.emplace(kHeldUntilDate, *heldUntil);
    activities.emplace(identifier, std::move(registration));
  }
  Value::Dictionary tree = records_;
  tree.insert_or_assign(kActivities, std::move(activities));
  return tree;
}

ActivityTable::Registered ActivityTable::add(const std::string& identifier, const ActivityCriteria& criteria,
                                             RegistrationCause cause, ActivityBlock block, const Now& now,
                                             double draw) {
  Entry& entry = entries_[identifier];
  const Date opens = now.date + seconds(criteria.delay);
  entry.registration =
      Registration{criteria, now.date, opens + seconds(criteria.gracePeriod) * draw, cause, std::nullopt};
  entry.registrationNumber = ++lastNumber_;
  entry.earliest.reset();
  entry.backOff = 0;
  holdBack(entry, now);
  Registered registered{std::exchange(entry.block, std::move(block)), std::nullopt};
  if (entry.registration->heldUntil && std::exchange(entry.knownHold, entry.notBefore) != entry.notBefore) {
    registered.heldUntil = entry.registration->heldUntil;
  }
  return registered;
}

/// Throttles a new registration by a reaction: delays it if it would run before the limit of starts allows.
void ActivityTable::holdBack(Entry& entry, const Now& now) {
  Registration& registration = *entry.registration;
  entry.notBefore = 0;
  registration.heldUntil.reset();
  if (registration.cause == RegistrationCause::Demand || entry.starts.size() < kMostStarts) return;
  const double end = *(entry.starts.end() - kMostStarts) + kStartsPeriod;
  const Date date = now.date + (end - now.uptime);
  if (date <= registration.due) return;
  entry.notBefore = end;
  registration.heldUntil = date;
}

/// Removes a run that was deferred to the activity's own date from the counted starts, which can shorten the
/// hold of a newer registration. Returns whether that changes the tree.
bool ActivityTable::uncount(Entry& entry, const UnderWay& run, const Now& now) {
  if (!run.isCounted) return false;
  const auto start = std::ranges::find(entry.starts, run.started);
  if (start != entry.starts.end()) entry.starts.erase(start);
  if (entry.registrationNumber == run.registrationNumber || !entry.registration->heldUntil) return false;
  holdBack(entry, now);
  return true;
}

ActivityBlock ActivityTable::checkIn(const std::string& identifier, ActivityBlock block) {
  Entry& entry = entries_[identifier];
  if (entry.registration && entry.block) return block;
  return std::exchange(entry.block, std::move(block));
}

bool ActivityTable::isRegisteredFor(const std::string& identifier, Date date) const {
  const auto found = entries_.find(identifier);
  if (found == entries_.end() || !found->second.registration) return false;
  const Registration& registration = *found->second.registration;
  const Date opens = registration.registered + seconds(registration.criteria.delay);
  // A date that had passed when it was registered opened its window at once.
  return opens <= std::max(date, registration.registered) + kRounding &&
         registration.due <= opens + seconds(registration.criteria.gracePeriod);
}

// Occasions.

void ActivityTable::noticeSystemVersion(const std::string& identifier,
                                        const std::optional<std::string>& version, bool isOwed) {
  const auto found = records_.find(kOSVersion);
  const bool isRecorded = found != records_.end();
  const bool isAnother = version && isRecorded && found->second != Value(*version);
  if (isRecorded && !isAnother && !isOwed) return;
  // An unknown version is recorded as the previous one, or as empty, so that the occasion does not come back.
  const std::string recorded = isRecorded ? found->second.stringIfAny().value_or("") : "";
  noticeOccasion(identifier, OccasionKind::Upgrade, version.value_or(recorded));
}

bool ActivityTable::noticeBoot(const std::string& identifier, const std::string& boot) {
  const auto found = records_.find(kBootIdentifier);
  if (found == records_.end()) {
    records_.emplace(kBootIdentifier, boot);
    return true;
  }
  if (found->second != Value(boot)) noticeOccasion(identifier, OccasionKind::Boot, boot);
  return false;
}

void ActivityTable::noticeOccasion(const std::string& identifier, OccasionKind kind, std::string fact) {
  entries_[identifier].occasion = Occasion{kind, ++lastNumber_, std::move(fact)};
}

/// Whether the entry's occasion is next: the first of those that have a block, and no other is being served.
bool ActivityTable::isInTurn(const Entry& entry) const {
  return entry.occasion && std::ranges::none_of(entries_, [&entry](const auto& item) {
           const Entry& other = item.second;
           if (&other == &entry) return false;
           if (other.run && other.run->occasion) return true;
           return other.occasion && other.block && other.occasion->kind < entry.occasion->kind;
         });
}

/// Whether a run for an occasion is under way or about to start. An occasion that waits after a deferred run
/// holds up only the other occasions, not the registered activities.
bool ActivityTable::isServingOccasions(const Now& now) const {
  return std::ranges::any_of(entries_, [this, &now](const auto& item) {
    const Entry& entry = item.second;
    if (!entry.occasion || !entry.block) return false;
    return entry.run || (isInTurn(entry) && now.uptime >= entry.notBefore &&
                         now.date >= entry.earliest.value_or(now.date));
  });
}

// What is due.

/// Whether the entry can run as soon as its date has come.
bool ActivityTable::mayRun(const Entry& entry, const Now& now) const {
  if (!entry.block || entry.run || now.uptime < entry.notBefore) return false;
  if (isInTurn(entry)) return true;
  return entry.registration && (now.networkReachable || !entry.registration->criteria.requiresNetwork) &&
         !isServingOccasions(now);
}

/// The date that an entry which may run waits for; nothing if it can run at once.
std::optional<Date> ActivityTable::dateOf(const Entry& entry) const {
  if (isInTurn(entry)) return entry.earliest;
  return std::max(entry.registration->due, entry.earliest.value_or(entry.registration->due));
}

bool ActivityTable::isDue(const Entry& entry, const Now& now) const {
  if (!mayRun(entry, now)) return false;
  const auto date = dateOf(entry);
  return !date || now.date >= *date;
}

bool ActivityTable::isInWindow(const Entry& entry, const Now& now) {
  if (!entry.registration || entry.earliest) return false;
  return now.date >= entry.registration->registered + seconds(entry.registration->criteria.delay);
}

std::vector<ActivityTable::Run> ActivityTable::takeDue(const Now& now) {
  std::vector<Run> runs;
  const bool isAnyDue =
      std::ranges::any_of(entries_, [&](const auto& item) { return isDue(item.second, now); });
  if (!isAnyDue) return runs;
  for (auto& [identifier, entry] : entries_) {
    if (!isDue(entry, now) && !(mayRun(entry, now) && isInWindow(entry, now))) continue;
    UnderWay run;
    run.number = ++lastNumber_;
    run.registrationNumber = entry.registrationNumber;
    run.needsNetwork = entry.registration && entry.registration->criteria.requiresNetwork;
    if (isInTurn(entry)) run.occasion = entry.occasion->number;
    run.started = now.uptime;
    run.isCounted =
        !run.occasion && entry.registration && entry.registration->cause == RegistrationCause::Reaction;
    entry.run = run;
    if (run.isCounted) {
      entry.starts.push_back(now.uptime);
      // Keep one more than the limit needs: this one is removed again if its run does not count.
      if (entry.starts.size() > kMostStarts + 1) entry.starts.pop_front();
    }
    runs.push_back({identifier, run.number, entry.block});
  }
  return runs;
}

std::optional<double> ActivityTable::secondsToNext(const Now& now) const {
  std::optional<double> next;
  for (const auto& item : entries_) {
    const Entry& entry = item.second;
    // Asks for the moment at which `notBefore` has passed.
    if (!mayRun(entry, {now.date, std::max(now.uptime, entry.notBefore), now.networkReachable})) continue;
    double wait = std::max(entry.notBefore - now.uptime, 0.0);
    if (const auto date = dateOf(entry)) wait = std::max(wait, *date - now.date);
    next = std::min(next.value_or(wait), wait);
  }
  return next;
}

// Runs.

ActivityTable::Entry* ActivityTable::runningEntry(const std::string& identifier) {
  const auto found = entries_.find(identifier);
  return found == entries_.end() || !found->second.run ? nullptr : &found->second;
}

void ActivityTable::setEarliestDate(const std::string& identifier, Date date, const Now& now) {
  Entry* const entry = runningEntry(identifier);
  if (entry == nullptr || !std::isfinite(date.secondsSince1970) || date <= now.date - kJustPassed) return;
  entry->run->earliest = date;
}

void ActivityTable::noticeNetworkLoss() {
  for (auto& [identifier, entry] : entries_) {
    if (entry.run) entry.run->lostNetwork = true;
  }
}

bool ActivityTable::isRunThatNeedsNetwork(const std::string& identifier) const {
  const auto found = entries_.find(identifier);
  return found != entries_.end() && found->second.run && found->second.run->needsNetwork;
}

std::size_t ActivityTable::runsUnderWay() const {
  return static_cast<std::size_t>(
      std::ranges::count_if(entries_, [](const auto& item) { return item.second.run.has_value(); }));
}

ActivityTable::Ending ActivityTable::end(const std::string& identifier, std::uint64_t number,
                                         ActivityResult result, const Now& now) {
  Entry* const entry = runningEntry(identifier);
  if (entry == nullptr || entry->run->number != number) return {};
  const UnderWay run = *std::exchange(entry->run, std::nullopt);
  const bool isReplaced = entry->registrationNumber != run.registrationNumber;
  Ending ending;
  ending.changesTree = recordRun(identifier, result, now);
  if (result != ActivityResult::Finished) {
    if (run.earliest && uncount(*entry, run, now)) ending.changesTree = true;
    if (!isReplaced) defer(*entry, run, now);
    return ending;
  }
  if (run.occasion && entry->occasion && entry->occasion->number == *run.occasion) {
    const bool isBoot = entry->occasion->kind == OccasionKind::Boot;
    records_.insert_or_assign(isBoot ? kBootIdentifier : kOSVersion, entry->occasion->fact);
    entry->occasion.reset();
    ending.changesTree = ending.servesOccasion = true;
  }
  if (isReplaced) return ending;
  ending.changesTree = ending.changesTree || entry->registration;
  ending.released = std::move(entry->block);
  Entry rest;
  rest.starts = std::move(entry->starts);
  rest.knownHold = entry->knownHold;
  *entry = std::move(rest);
  return ending;
}

/// Returns whether the result differs from the last one. A new date alone is stored with the next change, so
/// that repeated deferrals do not rewrite the file each time.
bool ActivityTable::recordRun(const std::string& identifier, ActivityResult result, const Now& now) {
  const char* const name = result == ActivityResult::Finished ? "finished" : "deferred";
  const Value before = std::exchange(records_[kLastRuns], Value());
  Value::Dictionary runs = before.isDictionary() ? before.dictionary() : Value::Dictionary();
  runs.insert_or_assign(identifier, Value::Dictionary{{kResult, name}, {kEndedDate, now.date}});
  records_[kLastRuns] = std::move(runs);
  return before[identifier][kResult] != Value(name);
}

void ActivityTable::defer(Entry& entry, const UnderWay& run, const Now& now) {
  entry.earliest = run.earliest;
  entry.notBefore = run.started + kShortestCycle;
  if (run.earliest) {
    entry.backOff = 0;
    return;
  }
  // A run that waits for the network needs no back-off: it starts when the network is back.
  if (run.needsNetwork && (run.lostNetwork || !now.networkReachable)) return;
  entry.backOff = entry.backOff == 0 ? kFirstBackOff : std::min(2 * entry.backOff, kLongestBackOff);
  entry.notBefore = now.uptime + entry.backOff;
}

}  // namespace kvr
