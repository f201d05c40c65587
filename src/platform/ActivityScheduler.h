#pragma once

#include "platform/Completion.h"
#include "platform/Date.h"

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

enum class DeferralReason { NetworkLost, ProcessEnding };

/// Why an activity is registered.
enum class RegistrationCause {
  /// A client asks for it, an occasion that comes once, or the calendar alone: each is run, however many.
  Demand,
  /// A run, an answer of the service or a notification leads to it, which it may lead to again: how often
  /// such registrations are started is limited.
  Reaction
};

/// What a client that checks in knows of its activity's registration.
struct ActivityExpectation {
  Date date;                  ///< from when it may run
  ActivityCriteria criteria;  ///< with which to register it now, if it is not registered for that date
};

/// The answer to one run, given once, on any thread.
using ActivityHandler = Completion<ActivityResult>;
/// Runs an activity. Called on a thread of the platform's choosing, where it may block.
using ActivityBlock = std::function<void(ActivityHandler)>;

/// One client's handle on a named background activity.
///
/// An activity is either preregistered (the platform knows it: from an earlier start of the process, or
/// because the platform itself runs it on an occasion) or registered here with criteria. Registrations are
/// persistent. Destroying the handle changes nothing. Any thread.
class Activity {
 public:
  virtual ~Activity() = default;
  virtual const std::string& identifier() const = 0;
  /// Set before `schedule`: whether this only checks in for what the platform knows already.
  virtual void setPreregistered(bool preregistered) = 0;
  /// Set before `schedule`, for an activity that is not preregistered.
  virtual void setCriteria(const ActivityCriteria& criteria) = 0;
  /// Set before `schedule`, for an activity that is not preregistered; a reaction unless set.
  virtual void setCause(RegistrationCause cause) = 0;
  /// Installs the run block. Preregistered: for what the platform knows without a block. Not preregistered:
  /// registers the activity anew with its criteria, counted from now; an earlier registration of the
  /// identifier, one whose run is under way included, is replaced, and the end of that run leaves the new
  /// registration alone. The platform holds the block until the activity has finished or is registered anew.
  virtual void schedule(ActivityBlock block) = 0;
  /// Set before `schedule`, for a preregistered activity: what its client holds it to be registered for.
  /// Should the platform have lost that registration, or never got it, the activity is registered so.
  virtual void setExpectation(const ActivityExpectation& expectation) = 0;
  /// Set before `schedule`, for a preregistered activity: whether its client has no record of a run that
  /// there should have been. One that the platform runs after an upgrade is run then as after one.
  virtual void setOwed(bool isOwed) = 0;
  /// Tells the platform, during a run that is about to be deferred, the date before which running again is of
  /// no use.
  virtual void setEarliestDate(Date date) = 0;
  /// Why the platform asks the running activity to stop and defer, if it does.
  virtual std::optional<DeferralReason> shouldDefer() const = 0;
};

/// The platform's scheduler of named background activities. It runs an activity once, no earlier than its
/// delay, within its grace period where it can. A deferred run comes back by itself: within a second after
/// the date it waits for, else after 10 s, doubling up to an hour. Activities never run twice at once. What
/// reactions register is started six times in ten minutes at most.
class ActivityScheduler {
 public:
  virtual ~ActivityScheduler() = default;
  virtual std::unique_ptr<Activity> newActivity(std::string identifier) = 0;
  /// From here on no run is started: check-ins and registrations are only taken in, until as many `resume`
  /// follow. Any thread.
  virtual void suspend() = 0;
  virtual void resume() = 0;
};

}  // namespace kvr
