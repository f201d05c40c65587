#pragma once

#include "platform/services/ActivityScheduler.h"
#include "platform/value/Error.h"
#include "platform/value/Value.h"

#include <deque>
#include <map>
#include <string>
#include <vector>

namespace kvr {

/// The rules by which background activities run: what is registered, what is due, what a deferral leads to.
///
/// A *registration* is an activity's criteria and the dates that follow from them: its *window* opens `delay`
/// seconds after it was registered and is `gracePeriod` seconds long; the *due date* is one point in it,
/// drawn once. A *check-in* brings the block to run; without one a registration waits. An *occasion* is a
/// reason of the platform's own to run an activity that has checked in: the system was started anew, or
/// upgraded. Occasions are served one after the other, the boot before the upgrade whichever was noticed
/// first, and before what is registered, so that none works on what another is about to change.
///
///     table.add("outreach", {.delay = 3600, .gracePeriod = 360}, RegistrationCause::Demand, block, now,
///     0.5); const auto wait = table.secondsToNext(now);           // arm a timer for (auto& run :
///     table.takeDue(later)) start(run); table.end(identifier, number, ActivityResult::Finished, later);
///
/// Facts in, decisions out: it reads no clock and starts nothing. Not thread-safe.
class ActivityTable {
 public:
  /// The moment at which a question is asked.
  struct Now {
    Date date;          ///< by the wall clock
    double uptime = 0;  ///< seconds by a clock that nobody moves and that counts while suspended
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
    bool changesTree = false;     ///< whether what is persisted has changed
    bool servesOccasion = false;  ///< which is to be stored before anything else is started
    ActivityBlock released;       ///< a block that is not needed any more
  };

  /// What a registration led to.
  struct Registered {
    ActivityBlock replaced;         ///< a block that is not needed any more
    std::optional<Date> heldUntil;  ///< it waits until then for the limit of starts, which was not known yet
  };

  static constexpr double kFirstBackOff = 10;      ///< seconds
  static constexpr double kLongestBackOff = 3600;  ///< seconds
  /// Between the starts of two runs that are one registration's, in seconds.
  static constexpr double kShortestCycle = 0.5;
  /// An activity that reactions had started so often within so many seconds waits when one more registers it
  /// for before then. Nobody who can have it registered again and again (a service whose dates change with
  /// each answer, whoever posts notifications) makes it run without a pause. A run that the activity's own
  /// date deferred does not count.
  static constexpr std::size_t kMostStarts = 6;
  static constexpr double kStartsPeriod = 600;

  // What is persisted: registrations, the boot and system version whose occasions were served, and how each
  // activity's last run ended.

  /// Why a tree is not one that `tree` gave, if it is not.
  static std::optional<Error> complaintAbout(const Value& tree);
  /// Takes over the registrations of a sound tree, but for what is registered or recorded
  /// already.
  void adopt(const Value& tree);
  Value tree() const;

  /// Registers an activity anew. `draw`, from 0 to below 1, decides the due date. A run that is under way
  /// goes on and no longer concerns the registration.
  Registered add(const std::string& identifier, const ActivityCriteria& criteria, RegistrationCause cause,
                 ActivityBlock block, const Now& now, double draw);
  /// Brings a block for whatever the identifier is or will be due for; a registration that was made with a
  /// block keeps its own. Returns the block that is not needed.
  ActivityBlock checkIn(const std::string& identifier, ActivityBlock block);
  /// Whether the activity is registered to run from `date` on, or from when it was registered if the date had
  /// passed then, and within its
  /// grace period.
  bool isRegisteredFor(const std::string& identifier, Date date) const;

  /// An occasion when none or another version is recorded, or when a run is owed. Nothing as the version (it
  /// cannot be found out) is no other one. The version is recorded once the run has finished.
  void noticeSystemVersion(const std::string& identifier, const std::optional<std::string>& version,
                           bool isOwed);
  /// An occasion when another boot is recorded, or when `recordsLost`: then it may have been any. The first
  /// boot ever is only recorded. Returns whether what is persisted has changed.
  bool noticeBoot(const std::string& identifier, const std::string& boot, bool recordsLost);

  /// The runs to start now; they count as under way. Whatever is in its window goes along with what is due.
  std::vector<Run> takeDue(const Now& now);
  /// Seconds until something will be due, the network staying as it is; nothing when nothing will.
  std::optional<double> secondsToNext(const Now& now) const;

  /// The date that the run under way waits for; one that lies in the past tells nothing.
  void setEarliestDate(const std::string& identifier, Date date, const Now& now);
  /// To be called when the network has gone: runs that need it may be deferred for this reason.
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
    std::optional<Date> heldUntil;  ///< by the limit of starts
  };
  /// In the order in which they are served.
  enum class OccasionKind { Boot, Upgrade };
  struct Occasion {
    OccasionKind kind = OccasionKind::Boot;
    std::uint64_t number = 0;
    std::string fact;  ///< is recorded once the occasion has been served
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
    // What deferrals led to, since the last registration.
    std::optional<Date> earliest;
    double notBefore = 0;  ///< uptime
    double backOff = 0;    ///< seconds of the last wait
    // These outlive registrations.
    std::deque<double> starts;  ///< the last ones that reactions led to, in uptime
    double knownHold = 0;       ///< the uptime until which a hold has been told
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
  Value::Dictionary records_;  ///< the tree's top level, but for the registrations
  std::uint64_t lastNumber_ = 0;
};

}  // namespace kvr
