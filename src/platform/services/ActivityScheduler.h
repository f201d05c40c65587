#pragma once

#include "platform/log/Completion.h"
#include "platform/value/Date.h"

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

namespace kvr {

enum class ActivityResult : std::int64_t { Finished = 1, Deferred = 2 };

/// When an activity may run.
struct ActivityCriteria {
  std::int64_t delay = 0;        ///< whole seconds from scheduling until it may run
  std::int64_t gracePeriod = 0;  ///< whole seconds after that within which it should run
  bool requiresNetwork = false;  ///< only while the network is reachable

  friend bool operator==(const ActivityCriteria&, const ActivityCriteria&) = default;
};

/// Why an activity is registered.
enum class RegistrationCause {
  /// Asked for by a client, by a one-time event (boot, upgrade), or by the calendar. Never throttled.
  Demand,
  /// Caused by a run, an answer of the service or a notification, each of which can recur without end.
  /// Throttled: see `ActivityScheduler`.
  Reaction
};

/// What a client tells the platform about its activity when it checks in.
struct ActivityCheckIn {
  /// The registration that the client believes to exist.
  struct Expectation {
    Date date;                  ///< the earliest date of the run
    ActivityCriteria criteria;  ///< for registering it now, if it is not registered for that date
  };
  std::optional<Expectation> expectation;
  /// Whether a run that should have happened is missing from the client's records. The platform then runs its
  /// after-upgrade activity as after an upgrade; for other activities this has no effect.
  bool isOwed = false;
};

/// A new registration of an activity.
struct ActivityRegistration {
  ActivityCriteria criteria;
  RegistrationCause cause = RegistrationCause::Reaction;
};

/// The answer to one run, given once, on any thread.
using ActivityHandler = Completion<ActivityResult>;
/// Runs an activity. Called on a thread of the platform's choosing, where it may block.
using ActivityBlock = std::function<void(ActivityHandler)>;

/// One client's handle on a named background activity. Registrations are persistent; destroying the handle
/// changes nothing. Any thread.
///
/// The platform keeps a run block until the activity has finished or is registered again.
class Activity {
 public:
  virtual ~Activity() = default;
  virtual const std::string& identifier() const = 0;
  /// Installs the run block of an activity that the platform already knows: from an earlier start of the
  /// process, or because the platform itself runs it after a boot or an upgrade. If the registration that the
  /// client expects is missing, the platform makes it.
  virtual void checkIn(const ActivityCheckIn& known, ActivityBlock block) = 0;
  /// Registers the activity; the delay counts from now. Replaces any earlier registration of the identifier.
  /// A run that is under way continues, and its end does not affect the new registration.
  virtual void registerAnew(const ActivityRegistration& registration, ActivityBlock block) = 0;
  /// To be called during a run that is about to be deferred: running again before `date` would be of no use.
  virtual void setEarliestDate(Date date) = 0;
  /// Whether the platform asks the running activity to stop and defer: the network that it needs is gone, or
  /// the process is ending.
  virtual bool shouldDefer() const = 0;
};

/// The platform's scheduler of named background activities. It runs each registration once, not before its
/// delay has passed, and within its grace period if possible. A deferred run is started again: within a
/// second after the date it waits for, or without such a date after 10 s, doubling up to an hour. Two runs of
/// one activity never overlap. Runs registered with cause `Reaction` are throttled to six starts of an
/// activity in ten minutes.
class ActivityScheduler {
 public:
  virtual ~ActivityScheduler() = default;
  virtual std::unique_ptr<Activity> newActivity(std::string identifier) = 0;
  /// Starts no further runs until the matching `resume`; check-ins and registrations are still accepted.
  /// Calls nest. Any thread.
  virtual void suspend() = 0;
  virtual void resume() = 0;
};

}  // namespace kvr
