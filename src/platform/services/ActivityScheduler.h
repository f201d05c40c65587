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
  /// A client asks for it, an occasion that comes once, or the calendar alone: each is run, however many.
  Demand,
  /// A run, an answer of the service or a notification leads to it, which it may lead to again: how often
  /// such registrations are started is limited.
  Reaction
};

/// What a client that checks in knows of its activity.
struct ActivityCheckIn {
  /// What it holds the activity to be registered for.
  struct Expectation {
    Date date;                  ///< from when it may run
    ActivityCriteria criteria;  ///< with which to register it now, if it is not registered for that date
  };
  std::optional<Expectation> expectation;
  /// Whether the client has no record of a run that there should have been. An activity that the platform
  /// runs after an upgrade is run then as after one.
  bool isOwed = false;
};

/// How an activity is registered anew.
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
/// The platform holds a run block until the activity has finished or is registered anew.
class Activity {
 public:
  virtual ~Activity() = default;
  virtual const std::string& identifier() const = 0;
  /// Installs the run block of an activity that the platform knows already: from an earlier start of the
  /// process, or because the platform itself runs it on an occasion. Should the platform have lost the
  /// registration that the client expects, or never got it, the activity is registered so.
  virtual void checkIn(const ActivityCheckIn& known, ActivityBlock block) = 0;
  /// Registers the activity with these criteria, counted from now. An earlier registration of the identifier,
  /// one whose run is under way included, is replaced, and the end of that run leaves the new one alone.
  virtual void registerAnew(const ActivityRegistration& registration, ActivityBlock block) = 0;
  /// Tells the platform, during a run that is about to be deferred, the date before which running again is of
  /// no use.
  virtual void setEarliestDate(Date date) = 0;
  /// Whether the platform asks the running activity to stop and defer: the network that it needs is gone, or
  /// the process is ending.
  virtual bool shouldDefer() const = 0;
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
