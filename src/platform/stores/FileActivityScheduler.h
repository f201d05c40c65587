#pragma once

#include "platform/log/Log.h"
#include "platform/services/Clock.h"
#include "platform/services/DeviceProperties.h"
#include "platform/services/Random.h"
#include "platform/services/WorkQueues.h"
#include "platform/stores/ActivityTable.h"
#include "platform/stores/PropertyListFiles.h"

#include <atomic>
#include <cstddef>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

namespace kvr {

/// The activities that the platform runs on its own.
struct ActivityOccasions {
  std::string afterUpgrade;  ///< once on a new device, when a run is owed, and when the version has changed
  std::string afterBoot;     ///< after every boot but the first one recorded
};

/// A scheduler that keeps its registrations in a property list below "Library/Activities" of the home
/// directory. `ActivityTable` has the rules; the derived class provides timer, boot identifier and network
/// state.
///
/// The file is read on first use. If registrations are lost with a damaged file, the post-boot activity runs
/// as after a boot and registers what is pending, and a check-in that states an expected date is registered
/// for that date. A file that exists but cannot be read is not overwritten; until it can be read,
/// registrations are kept in memory only.
///
/// Runs start on the concurrent queue of default priority. After an occasion has been served, no run starts
/// until that is stored: otherwise a process killed then would repeat the occasion after the runs that
/// followed it. End the queues before you destroy the scheduler.
class FileActivityScheduler : public ActivityScheduler {
 public:
  std::unique_ptr<Activity> newActivity(std::string identifier) override;
  void suspend() override;
  void resume() override;

  /// Starts no further runs, and asks those under way to defer. Any thread.
  void beginEnding();
  /// Number of runs that were handed to the queue and have not ended. Any thread.
  std::size_t runsUnderWay() const;

 protected:
  FileActivityScheduler(PropertyListFiles& lists, const Clock& clock, WorkQueues& queues, Random& random,
                        const DeviceProperties& device, Log& log, const std::string& mainBundleIdentifier,
                        ActivityOccasions occasions);

  /// Seconds of a clock that is never set and also counts while the device is suspended.
  virtual double uptime() const = 0;
  virtual std::string bootIdentifier() const = 0;
  /// Arranges a call of `startDue` after `wait` seconds, or earlier if the wall clock is set; without a
  /// value, no call. Replaces the previous arrangement. Called on any thread, one call at a time.
  virtual void arm(std::optional<double> wait) = 0;

  /// Starts what is due, and calls `arm` for the next run.
  void startDue();
  /// The network counts as reachable until this is called.
  void setNetworkReachable(bool reachable);
  Log& log() const { return log_; }
  /// Expires with this object.
  std::weak_ptr<const bool> life() const { return life_; }

 private:
  class Handle;
  class RunEnd;
  class Suspension;

  void checkIn(const std::string& identifier, const ActivityCheckIn& known, ActivityBlock block);
  void registerAnew(const std::string& identifier, const ActivityRegistration& registration,
                    ActivityBlock block);
  void setEarliestDate(const std::string& identifier, Date date);
  bool shouldDefer(const std::string& identifier) const;
  void end(const std::string& identifier, std::uint64_t number, ActivityResult result);

  ActivityTable::Now now() const;
  double draw();
  void load();
  void start(ActivityBlock block, const std::shared_ptr<RunEnd>& end);
  void save();
  bool adoptUnreadable();
  bool write();

  PropertyListFiles& lists_;
  const Clock& clock_;
  WorkQueues& queues_;
  Random& random_;
  const DeviceProperties& device_;
  Log& log_;
  const std::string directory_;
  const std::string path_;
  const ActivityOccasions occasions_;

  const std::shared_ptr<Turns> fileTurns_;  ///< for reading and writing the file
  std::atomic<bool> loaded_{false};         ///< the file is loaded before the table is used
  mutable std::mutex mutex_;                ///< guards the members below; never held while a file is accessed
  ActivityTable table_;
  bool unreadable_ = false;  ///< the file could not be read yet, so it must not be overwritten
  bool networkReachable_ = true;
  int suspensions_ = 0;
  bool ending_ = false;

  /// Destroyed first, so that nothing that is released with the other members calls back.
  const std::shared_ptr<const bool> life_ = std::make_shared<const bool>(true);
};

}  // namespace kvr
