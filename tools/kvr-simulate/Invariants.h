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

/// What operators set the length of a day to, in seconds; the first one is what it is otherwise.
inline constexpr std::array kDayLengths{86400, 1800, 7200};

/// How much life was covered.
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

  void add(const Figures& other);
};

/// Whether a service of that version has no watches looked after.
bool isWithoutWatches(const Value& serverVersion);

/// An invariant that did not hold.
struct Breach {
  std::string invariant;
  std::string detail;
};

/// What must hold whatever happens. It is told what the agent does, at the moment when it does it, and keeps
/// the first breach.
class Invariants {
 public:
  explicit Invariants(World& world) : world_(world) {}

  const std::optional<Breach>& breach() const { return breach_; }
  void report(const std::string& invariant, const std::string& detail);

  // A process.

  /// Before the agent starts: what it finds must be sound.
  void beginProcess(SimulatedPlatform& platform);
  /// The process is told to end, while somebody waits for the dismissal of these devices' follow-ups.
  void beginEnding(std::set<std::string> serialNumbersToDismiss) {
    endDismisses_ = std::move(serialNumbersToDismiss);
  }
  /// From here on it is nobody's fault what the process does.
  void endProcess();
  /// Whether the process is alive and not cut off from its files.
  bool isWatching() const { return platform_ != nullptr && !platform_->files.isKilled(); }
  /// After every work item.
  void step();
  /// With everything quiet for a while: nothing is overdue, and what is shown is up to date.
  void checkCalm();
  /// After the faults have stopped and every device was looked up anew.
  void checkRest(Date postedAt);

  // What the agent does.

  void runBegins(const std::string& activity);
  void runEnds(const std::string& activity, ActivityResult result);
  /// Whether it takes the place of one that is shown.
  bool posting(const FollowUpItem& item, const std::vector<FollowUpItem>& pending);
  void posted(const FollowUpItem& item, bool wasPending, bool isDone);
  void clearing(const std::vector<std::string>& uniqueIdentifiers, const std::vector<FollowUpItem>& pending);
  void fileChanged(const std::string& path, bool isDone);
  void requested(const HTTPRequest& request, bool isCoverage);
  void coverageAnswered(int status);
  void answered(const Value& warranty);

  // What happens to it.

  /// Activities may run anew.
  void excuseRuns() { runTimes_.clear(); }
  void clockMoved();
  /// Something after which look-ups may fail for a while, or have found out something else before.
  void trouble() { troubled_ = world_.now; }
  void dismissalAsked(const std::string& serialNumber) { dismissed_.insert(serialNumber); }
  void suspended(double seconds);
  /// What is shown may be what was shown before.
  void powerLost() { refreshed_.clear(); }
  /// Faults of files begin: what is not recorded then is lost.
  void excuseFiles() { filesFail_ = filesFailed_ = true; }
  void endFileFaults() { filesFail_ = false; }
  /// Somebody else changed files.
  void allowDamage() { damageIsPlanted_ = filesFailed_ = true; }
  void readFilesAgain();

  Figures figures;
  double shortestDay = 86400;  ///< that was ever configured, in seconds

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
    bool hasNews = false;  ///< a conversion date, which could not be stored so far
  };

  bool isStartingUp() const;
  void checkConversionDate(const Value& stored);
  void readCaches();
  void cacheChanged(const std::string& path);
  void downloaded(const std::string& lastUpdatedKey);
  void checkConversionStored(Cache& cache);
  std::optional<Date> conversionDateOf(const Value& warranty) const;
  bool isSurelyOpen(const std::string& serialNumber) const;
  void checkCleared(const std::string& serialNumber);
  void checkNames(const std::string& path);
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
  Value preferences_;  ///< as last seen
  std::set<std::string> toBeListed_;
  std::set<std::string> leftovers_;  ///< what was there when the process began
  std::map<std::string, std::string> durable_;
  bool filesFail_ = false;
  bool filesFailed_ = false;  ///< in this process, which may know of more than they hold
  bool damageIsPlanted_ = false;
  bool datesAreDamaged_ = false;  ///< and may be missing, until the chain of refreshes begins anew
  double clockMoved_ = -1;
  /// When the refresh activity updated what is shown, by unique identifier. What others updated since has to
  /// wait for the refresh that was scheduled before.
  std::map<std::string, double> refreshed_;
  std::set<std::string> begun_;     ///< activities, in this process
  Value conversionAtStart_;         ///< for when the conversion outreach was pending when the process began
  std::set<Date> conversionDates_;  ///< that the service ever brought
  std::map<std::string, Cache> caches_;
  std::set<std::string> dismissed_;  ///< serial numbers, in this process
  double troubled_ = -1e9;
  std::set<std::string> expired_;  ///< by a clock that was set anew since, in this process
  std::optional<std::set<std::string>> endDismisses_;  ///< once the process is told to end
  double lastRequest_ = -1e9;
  std::size_t versionRequests_ = 0;
  std::size_t coverageRequests_ = 0;
  bool everyAnswerRefused_ = true;
};

}  // namespace kvr::simulate
