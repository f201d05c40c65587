#pragma once

#include "platform/services/ActivityScheduler.h"
#include "platform/value/Error.h"
#include "platform/value/Value.h"

#include <deque>
#include <map>
#include <string>
#include <vector>

namespace kvr {

/// The rules for running background activities: what is registered, what is due, and what follows a deferral.
///
/// A *registration* is an activity's criteria and its dates. Its *window* opens `delay` seconds after the
/// registration and lasts `gracePeriod` seconds; the *due date* is a random point in the window, drawn once.
/// A *check-in* supplies the block to run; a registration without a block waits for one. An *occasion* is the
/// platform's own reason to run an activity that has checked in: a boot or a system upgrade. Occasions are
/// served one at a time, always the boot before the upgrade, and before registered activities, so that no run
/// works on data that another run is about to change.
///
///     table.add("outreach", {.delay = 3600}, RegistrationCause::Demand, block, now, 0.5);
///     const auto wait = table.secondsToNext(now);  // arm a timer
///     for (auto& run : table.takeDue(later)) start(run);
///     table.end(identifier, number, ActivityResult::Finished, later);
///
/// It only decides: it reads no clock and starts nothing. Not thread-safe.
class ActivityTable {
 public:
  /// The current moment, as the caller sees it.
  struct Now {
    Date date;          ///< by the wall clock
    double uptime = 0;  ///< seconds of a clock that is never set and also counts during suspend
    bool networkReachable = true;
  };

  /// A run that is to be started.
  struct Run {
    std::string identifier;
    std::uint64_t number = 0;
    ActivityBlock block;
  };

  /// What the end of a run led to.
  struct Ending {
    bool changesTree = false;     ///< whether the persisted tree has changed
    bool servesOccasion = false;  ///< whether it served an occasion: store that before any start
    ActivityBlock released;       ///< a block that is not needed any more
  };

  /// What a registration led to.
  struct Registered {
    ActivityBlock replaced;         ///< a block that is not needed any more
    std::optional<Date> heldUntil;  ///< throttled until then, and not reported before
  };

  static constexpr double kFirstBackOff = 10;      ///< seconds
  static constexpr double kLongestBackOff = 3600;  ///< seconds
  /// Least time between the starts of two runs of one registration, in seconds.
  static constexpr double kShortestCycle = 0.5;
  /// The throttle: after `kMostStarts` starts caused by reactions within `kStartsPeriod` seconds, a further
  /// registration by a reaction waits until the period is over. Otherwise a service whose dates change with
  /// each answer, or a program that posts notifications, could make an activity run without a pause. A run
  /// that was deferred to the activity's own date does not count.
  static constexpr std::size_t kMostStarts = 6;
  static constexpr double kStartsPeriod = 600;

  // What is persisted: registrations, the boot and system version whose occasions were served, and how each
  // activity's last run ended.

  /// What is wrong with a stored tree; nothing if `adopt` can take it.
  static std::optional<Error> complaintAbout(const Value& tree);
  /// Takes over the registrations and records of a sound tree. What the table already has is kept.
  void adopt(const Value& tree);
  Value tree() const;

  /// Registers an activity, replacing an earlier registration. `draw`, at least 0 and below 1, places the due
  /// date in the window. A run that is under way continues, and its end does not affect the new registration.
  Registered add(const std::string& identifier, const ActivityCriteria& criteria, RegistrationCause cause,
                 ActivityBlock block, const Now& now, double draw);
  /// Installs the block to run, unless there is a registration that already has one. Returns the block that
  /// is not needed.
  ActivityBlock checkIn(const std::string& identifier, ActivityBlock block);
  /// Whether there is a registration whose window opens no later than `date` (or than the registration
  /// itself, if the date had already passed then) and whose due date lies within that window.
  bool isRegisteredFor(const std::string& identifier, Date date) const;

  /// Makes an upgrade occasion if no version or a different one is recorded, or if a run is owed. An unknown
  /// version (nothing) does not count as different. The version is recorded once the run has finished.
  void noticeSystemVersion(const std::string& identifier, const std::optional<std::string>& version,
                           bool isOwed);
  /// Makes a boot occasion if a different boot is recorded.
  /// The first boot ever is only recorded. Returns whether the persisted tree has changed.
  bool noticeBoot(const std::string& identifier, const std::string& boot);

  /// Returns the runs to start now and counts them as under way. When anything is due, every activity whose
  /// window is open runs along with it.
  std::vector<Run> takeDue(const Now& now);
  /// Seconds until the next run is due if the network state stays the same; nothing if no run is expected.
  std::optional<double> secondsToNext(const Now& now) const;

  /// Sets the date that the run under way waits for. A date in the past is ignored.
  void setEarliestDate(const std::string& identifier, Date date, const Now& now);
  /// Call this when the network is lost: runs that need it may be deferred for this reason, then without a
  /// back-off.
  void noticeNetworkLoss();
  /// Whether a run is under way that needs the network.
  bool isRunThatNeedsNetwork(const std::string& identifier) const;
  std::size_t runsUnderWay() const;
  Ending end(const std::string& identifier, std::uint64_t number, ActivityResult result, const Now& now);

 private:
  struct Registration {
    ActivityCriteria criteria;
    Date registered;
    Date due;
    RegistrationCause cause = RegistrationCause::Demand;
    std::optional<Date> heldUntil;  ///< by the throttle
  };
  /// In the order in which they are served.
  enum class OccasionKind { Boot, Upgrade };
  struct Occasion {
    OccasionKind kind = OccasionKind::Boot;
    std::uint64_t number = 0;
    std::string fact;  ///< recorded once the occasion has been served
  };
  struct UnderWay {
    std::uint64_t number = 0;
    std::uint64_t registrationNumber = 0;
    bool needsNetwork = false;
    bool lostNetwork = false;
    std::optional<std::uint64_t> occasion;  ///< its number
    double started = 0;                     ///< uptime
    bool isCounted = false;                 ///< among the starts
    std::optional<Date> earliest;
  };
  struct Entry {
    std::optional<Registration> registration;
    std::uint64_t registrationNumber = 0;
    std::optional<Occasion> occasion;
    ActivityBlock block;
    std::optional<UnderWay> run;
    // The result of deferrals since the last registration.
    std::optional<Date> earliest;
    double notBefore = 0;  ///< uptime
    double backOff = 0;    ///< seconds of the last wait
    // These outlive registrations.
    std::deque<double> starts;  ///< uptimes of the latest starts caused by reactions
    double knownHold = 0;       ///< end (uptime) of the last throttling that was reported
  };

  static void holdBack(Entry& entry, const Now& now);
  static bool uncount(Entry& entry, const UnderWay& run, const Now& now);
  Entry* runningEntry(const std::string& identifier);
  void noticeOccasion(const std::string& identifier, OccasionKind kind, std::string fact);
  bool isInTurn(const Entry& entry) const;
  bool isServingOccasions(const Now& now) const;
  bool mayRun(const Entry& entry, const Now& now) const;
  std::optional<Date> dateOf(const Entry& entry) const;
  bool isDue(const Entry& entry, const Now& now) const;
  static bool isInWindow(const Entry& entry, const Now& now);
  bool recordRun(const std::string& identifier, ActivityResult result, const Now& now);
  void defer(Entry& entry, const UnderWay& run, const Now& now);

  std::map<std::string, Entry, std::less<>> entries_;
  Value::Dictionary records_;  ///< the tree's top level, without the registrations
  std::uint64_t lastNumber_ = 0;
};

}  // namespace kvr
