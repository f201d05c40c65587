#include "core/scheduling/KVRScheduler.h"

#include "core/scheduling/ActivityRegistry.h"
#include "core/scheduling/SchedulingKeys.h"
#include "platform/names/Names.h"

#include <algorithm>
#include <exception>
#include <utility>

namespace kvr {
namespace {

constexpr double kHandBackDelay = 1;    // seconds
constexpr double kLongestDelay = 1e15;  // seconds; the calendar's own limit
constexpr double kGraceShare = 10;      // the grace period is the delay divided by this

/// The criteria for a delay in seconds; a negative one counts as 0.
ActivityCriteria criteria(double delay, bool requiresNetwork) {
  delay = delay > 0 ? std::min(delay, kLongestDelay) : 0;
  ActivityCriteria criteria;
  criteria.gracePeriod = static_cast<std::int64_t>(delay / kGraceShare);
  criteria.delay = static_cast<std::int64_t>(delay);
  criteria.requiresNetwork = requiresNetwork;
  return criteria;
}

/// Delivers a run's result to the platform: when `give` is called, or on destruction if the process ends
/// before.
class HandBack {
 public:
  HandBack(ActivityHandler handler, ActivityResult result) : handler_(std::move(handler)), result_(result) {}
  HandBack(const HandBack&) = delete;
  HandBack& operator=(const HandBack&) = delete;
  ~HandBack() {
    try {
      give();
    } catch (const std::exception&) {
      isGiven_ = true;  // the platform takes the run up again at the next start
    }
  }

  void give() {
    if (!std::exchange(isGiven_, true)) handler_(result_);
  }

 private:
  const ActivityHandler handler_;
  const ActivityResult result_;
  bool isGiven_ = false;
};

}  // namespace

std::shared_ptr<KVRScheduler> KVRScheduler::newSchedulerWithActivityDelegate(
    Platform& platform, const std::shared_ptr<KVRSchedulerActivityDelegate>& activityDelegate) {
  return std::make_shared<KVRScheduler>(platform, activityDelegate);
}

std::shared_ptr<KVRScheduler> KVRScheduler::newSchedulerForActivity(Platform& platform,
                                                                    const char* identifier) {
  return newSchedulerWithActivityDelegate(platform, ActivityRegistry::of(platform).newActivity(identifier));
}

KVRScheduler::KVRScheduler(Platform& platform,
                           const std::shared_ptr<KVRSchedulerActivityDelegate>& theDelegate)
    : activityDelegate(theDelegate),
      platform_(platform),
      activity_(platform.activities.newActivity(theDelegate->identifier())),
      targetDateKey_(activity_->identifier() + names::kTargetDateSuffix) {}

void KVRScheduler::clearScheduledActivities(Platform& platform) {
  for (const auto& key : platform.preferences.allKeys()) {
    if (!key.ends_with(names::kTargetDateSuffix)) continue;
    platform.log.standard("Clearing %@", key);
    platform.preferences.removeObject(key);
  }
}

Turn KVRScheduler::takeTurn(Platform& platform) {
  struct SchedulingTurns {
    std::shared_ptr<Turns> turns;
  };
  const auto shared = platform.sharedObjects.get<SchedulingTurns>(
      [&] { return new SchedulingTurns{platform.queues.newTurns("scheduling")}; });
  return Turn(*shared->turns);
}

void KVRScheduler::monitorForScheduledActivity() {
  platform_.log.standard("monitorForScheduledActivity for '%@'", identifier());
  ActivityCheckIn known{.expectation = {}, .isOwed = activityDelegate()->isOwed()};
  if (const auto target = scheduledActivityDate()) {
    known.expectation = {*target,
                         criteria(*target - platform_.clock.now(), activityDelegate()->requiresNetwork())};
  }
  activity_->checkIn(known, [self = shared_from_this()](const ActivityHandler& handler) {
    self->performScheduledOutreachWithBlock(handler);
  });
}

void KVRScheduler::scheduleActivityWithDelay(double delay, RegistrationCause cause) {
  _scheduleActivityWithDelay(delay, platform_.clock.now() + delay, cause);
}

void KVRScheduler::scheduleActivityForDate(std::optional<Date> date, RegistrationCause cause) {
  _scheduleActivityWithDelay(date ? *date - platform_.clock.now() : 0, date, cause);
}

void KVRScheduler::_scheduleActivityWithDelay(double delay, std::optional<Date> forDate,
                                              RegistrationCause cause) {
  const auto turn = takeTurn(platform_);
  platform_.log.standard("scheduled '%@' with delay: %.02f (%@)", identifier(), delay, forDate);
  const ActivityRegistration registration{criteria(delay, activityDelegate()->requiresNetwork()), cause};
  platform_.preferences.setObject(forDate, targetDateKey_);
  activity_->registerAnew(registration, [self = shared_from_this()](const ActivityHandler& handler) {
    self->platform_.log.standard("Velt activity block occured '%@' at (%@)", self->identifier(),
                                 self->platform_.clock.now());
    self->performScheduledOutreachWithBlock(handler);
  });
}

std::optional<Date> KVRScheduler::scheduledActivityDate() const {
  return platform_.preferences.dateForKey(targetDateKey_);
}

void KVRScheduler::performScheduledOutreachWithBlock(const ActivityHandler& block) {
  auto& log = platform_.log;
  const auto stored = platform_.preferences.objectForKey(targetDateKey_);
  const auto target = stored.dateIfAny();
  log.standard("activity for '%@' should occur on: %@", identifier(), target);
  const double remaining = target ? *target - platform_.clock.now() : 0;
  const ActivityHandler handler(log, "performScheduledOutreachWithBlock",
                                [self = shared_from_this(), stored, block](ActivityResult result) {
                                  self->relay(result, stored, block);
                                });
  if (remaining > 0) {
    log.standard("target not past for '%@', defer for: %.02f", identifier(), remaining);
    activity_->setEarliestDate(*target);
    handler(ActivityResult::Deferred);
    return;
  }
  log.standard("target reached for '%@', trigger activity", identifier());
  activityDelegate()->performActivityForScheduler(shared_from_this(), handler);
}

void KVRScheduler::relay(ActivityResult result, const Value& startedFor, const ActivityHandler& block) {
  if (result == ActivityResult::Finished) {
    // A date other than the one this run started for belongs to the next run.
    platform_.preferences.update(
        targetDateKey_, [&](const Value& stored) { return stored == startedFor ? Value() : stored; });
  }
  platform_.queues.after(kHandBackDelay, platform_.queues.mainQueue(),
                         [handBack = std::make_shared<HandBack>(block, result)] { handBack->give(); });
}

}  // namespace kvr
