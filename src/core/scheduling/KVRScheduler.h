#pragma once

#include "core/scheduling/KVRSchedulerActivityDelegate.h"
#include "platform/Platform.h"
#include "platform/value/AtomicProperty.h"

#include <memory>
#include <optional>
#include <string>

namespace kvr {

/// Runs an activity no earlier than a target date that outlives the process.
///
/// Scheduling stores the target date in the preferences and registers the activity with the platform.
/// Whenever the platform runs the activity, the gate compares the stored date with the clock: before it, the
/// run is deferred; from it on, and without a stored date, the delegate does the work. When the delegate
/// reports `Finished`, the date is removed, unless the activity was scheduled for another date meanwhile. The
/// platform learns the result a second later, on the main queue.
///
///     KVRScheduler::newSchedulerForActivity(platform, names::kOutreach)->scheduleActivityForDate(date);
///
/// A scheduler is kept alive by the block that the platform holds, and by a run under way. Any thread.
class KVRScheduler : public std::enable_shared_from_this<KVRScheduler> {
 public:
  static std::shared_ptr<KVRScheduler> newSchedulerWithActivityDelegate(
      Platform& platform, const std::shared_ptr<KVRSchedulerActivityDelegate>& activityDelegate);
  /// The same for a new activity of this name, which start-up has put into the registry.
  static std::shared_ptr<KVRScheduler> newSchedulerForActivity(Platform& platform, const char* identifier);
  /// Use one of the above.
  KVRScheduler(Platform& platform, const std::shared_ptr<KVRSchedulerActivityDelegate>& activityDelegate);

  /// Removes the target date of every activity. What the platform has registered stays registered.
  static void clearScheduledActivities(Platform& platform);

  /// Takes a scheduling turn, of which there is one at a time on a platform. It makes storing a date and
  /// registering its activity one step, so that concurrent schedulings cannot mix. Code that decides by a
  /// stored date has a turn from reading the date until it has scheduled.
  static Turn takeTurn(Platform& platform);

  /// Checks in for an activity that was scheduled by an earlier start, or that the platform runs by itself.
  void monitorForScheduledActivity();
  /// `delay` in seconds; a negative one gives a target date in the past. Pass `Demand` for a client's
  /// request.
  void scheduleActivityWithDelay(double delay, RegistrationCause cause = RegistrationCause::Reaction);
  /// A date in the past, or no date, means no delay; no date also removes the stored one.
  void scheduleActivityForDate(std::optional<Date> date,
                               RegistrationCause cause = RegistrationCause::Reaction);
  /// The stored target date.
  std::optional<Date> scheduledActivityDate() const;
  /// The gate: one run by the platform. Answers `block` once.
  void performScheduledOutreachWithBlock(const ActivityHandler& block);

  /// Whether the platform asks the running activity to stop and defer.
  bool shouldDefer() const { return activity_->shouldDefer(); }
  const std::string& identifier() const { return activity_->identifier(); }

  AtomicProperty<std::shared_ptr<KVRSchedulerActivityDelegate>> activityDelegate;

 private:
  void _scheduleActivityWithDelay(double delay, std::optional<Date> forDate, RegistrationCause cause);
  void relay(ActivityResult result, const Value& startedFor, const ActivityHandler& block);

  Platform& platform_;
  const std::unique_ptr<Activity> activity_;
  const std::string targetDateKey_;
};

}  // namespace kvr
