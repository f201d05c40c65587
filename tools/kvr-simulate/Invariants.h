#pragma once

#include "kvr-simulate/World.h"
#include "platform/services/ActivityScheduler.h"
#include "platform/services/FollowUpCenter.h"

#include <array>
#include <deque>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace kvr::simulate {

/// The day lengths that operators set, in seconds; the first one is the default.
inline constexpr std::array kDayLengths{86400, 1800, 7200};

/// Counts of what was simulated.
struct Figures {
  std::size_t starts = 0;
  std::size_t crashes = 0;
  std::size_t powerLosses = 0;
  std::size_t calls = 0;
  std::size_t requests = 0;
  std::size_t posts = 0;
  std::size_t clockJumps = 0;
  std::size_t fileFaults = 0;
  std::size_t runs = 0;
  std::size_t pauses = 0;

  void add(const Figures& other);
};

/// Whether a service with this version does not handle watches.
bool isWithoutWatches(const Value& serverVersion);

/// An invariant that did not hold.
struct Breach {
  std::string invariant;
  std::string detail;
};

/// What must always hold. It is told of each action of the agent as it happens, and keeps the first breach.
class Invariants {
 public:
  explicit Invariants(World& world) : world_(world) {}

  const std::optional<Breach>& breach() const { return breach_; }
  void report(const std::string& invariant, const std::string& detail);

  // The process.

  /// Call before the agent starts: the files that it finds must be sound.
  void beginProcess(SimulatedPlatform& platform);
  /// The process is told to end, while clients wait for the dismissal of these devices' follow-ups.
  void beginEnding(std::set<std::string> serialNumbersToDismiss) {
    endDismisses_ = std::move(serialNumbersToDismiss);
  }
  /// From now on nothing that the process does counts.
  void endProcess();
  /// Whether the process is alive and not cut off from its files.
  bool isWatching() const { return platform_ != nullptr && !platform_->files.isKilled(); }
  /// Call after every work item; others may be in the middle.
  void step();
  /// Call when nothing has happened for a while: nothing may be overdue, and what is shown must be up to
  /// date.
  void checkCalm();
  /// Call after all faults have stopped and every device was looked up again.
  void checkRest(Date postedAt);

  // What the agent does.

  void runBegins(const std::string& activity);
  void runEnds(const std::string& activity, ActivityResult result);
  /// Returns whether the item replaces one that is shown.
  bool posting(const FollowUpItem& item, const std::vector<FollowUpItem>& pending);
  void posted(const FollowUpItem& item, bool wasPending, bool isDone);
  void clearing(const std::vector<std::string>& uniqueIdentifiers, const std::vector<FollowUpItem>& pending);
  void fileChanged(const std::string& path, bool isDone);
  void requested(const HTTPRequest& request, bool isCoverage);
  void coverageAnswered(int status);
  void answered(const Value& warranty);

  // What happens to the agent.

  /// From now on the limit on runs counts again from zero.
  void excuseRuns() { runTimes_.clear(); }
  void clockMoved();
  /// From now on look-ups may fail for a while, or may have found something else before.
  void trouble() { troubled_ = world_.now; }
  void dismissalAsked(const std::string& serialNumber) { dismissed_.insert(serialNumber); }
  /// A client was told that this device's follow-up is dismissed.
  void dismissalAnswered(const std::string& serialNumber) {
    answered_.insert_or_assign(serialNumber, world_.now);
  }
  void suspended(double seconds);
  /// After this, items may be shown with an earlier text.
  void powerLost() { refreshed_.clear(); }
  /// File faults begin: what cannot be recorded during them is lost.
  void excuseFiles() { filesFail_ = filesFailed_ = true; }
  void endFileFaults() { filesFail_ = false; }
  /// Somebody else has changed files.
  void allowDamage() { damageIsPlanted_ = filesFailed_ = true; }
  void readFilesAgain();

  Figures figures;
  double shortestDay = 86400;  ///< the shortest one ever configured, in seconds

 private:
  struct Run {
    Value startedFor;
    Date started;
    double began = 0;
    bool isFirstUpgrade = false;
    bool removedDate = false;
  };
  struct Cache {
    Value warranty;
    Value earlier;
    double changed = -1e9;
    bool hasNews = false;  ///< it has a conversion date that could not be stored yet
  };

  bool isStartingUp() const;
  void checkConversionDate(const Value& stored);
  void reportFaults();
  void checkListed();
  void checkDismissed();
  void readCaches();
  void cacheChanged(const std::string& path);
  void downloaded(const std::string& lastUpdatedKey);
  void checkConversionStored(Cache& cache);
  std::optional<Date> conversionDateOf(const Value& warranty) const;
  bool isSurelyOpen(const std::string& serialNumber) const;
  void checkCleared(const std::string& serialNumber);
  void checkNames(const std::string& path);
  void checkContents(const std::string& path);
  void checkPreferences();
  void checkChange(const std::string& key, const Value& before, const Value& after, const Value& tree);
  void checkTargetDateRemoval(const std::string& activity, const Value& before);
  void checkPostedList(const Value& before, const Value& after, const Value& tree);
  void checkFollowUps();
  void rememberExpired();
  void checkNewPost(const Offer& offer, const std::string& name, Date now);
  void checkOverdue(const Value& preferences, const Value& registrations);
  void checkShown(const Value& preferences, const Value& registrations);
  void checkDevice(const std::string& serialNumber, const std::vector<FollowUpItem>& pending, Date postedAt);
  bool isDismissed(const Offer& offer, const Value& stored) const;
  std::vector<FollowUpItem> pendingItems() const;
  std::optional<Date> activationOf(const std::string& serialNumber, const Value& preferences) const;
  Value preferences() const;

  World& world_;
  std::optional<Breach> breach_;
  SimulatedPlatform* platform_ = nullptr;
  std::map<std::string, Run> runs_;
  std::map<std::string, std::deque<double>> runTimes_;
  Value preferences_;                         ///< as last seen
  std::map<std::string, double> toBeListed_;  ///< hashes of devices, and when their follow-ups were posted
  std::set<std::string> leftovers_;           ///< files that existed when the process began
  std::map<std::string, std::string> durable_;
  bool filesFail_ = false;
  bool filesFailed_ = false;  ///< in this process; the agent may know more than its files contain
  bool damageIsPlanted_ = false;
  bool datesAreDamaged_ = false;  ///< dates may be missing until the next refresh is scheduled
  double clockMoved_ = -1;
  /// When the refresh activity last updated each shown item, by unique identifier. An item that others have
  /// updated since has to wait for the refresh that was scheduled before.
  std::map<std::string, double> refreshed_;
  std::set<std::string> begun_;     ///< activities that have run in this process
  Value conversionAtStart_;         ///< the target date of the conversion outreach when the process began
  std::set<Date> conversionDates_;  ///< all that the service ever sent
  std::map<std::string, Cache> caches_;
  std::set<std::string> dismissed_;         ///< serial numbers whose dismissal was requested in this process
  std::map<std::string, double> answered_;  ///< serial numbers whose dismissal was just answered, and when
  double troubled_ = -1e9;
  std::set<std::string> expired_;  ///< items that expired before the clock was set, in this process
  std::optional<std::set<std::string>> endDismisses_;  ///< set once the process is told to end
  double lastRequest_ = -1e9;
  std::size_t versionRequests_ = 0;
  std::size_t coverageRequests_ = 0;
  bool everyAnswerRefused_ = true;
};

}  // namespace kvr::simulate
