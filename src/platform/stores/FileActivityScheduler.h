#pragma once

#include "platform/log/Log.h"
#include "platform/services/Clock.h"
#include "platform/services/DeviceProperties.h"
#include "platform/services/Random.h"
#include "platform/services/WorkQueues.h"
#include "platform/stores/ActivityTable.h"
#include "platform/stores/PropertyListFiles.h"

#include <cstddef>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

namespace kvr {

/// The activities that the platform itself has run.
struct ActivityOccasions {
  std::string afterUpgrade;  ///< once on a new device, when a run is owed, and when the version has changed
  std::string afterBoot;     ///< whenever the device has been started anew
};

/// A scheduler whose registrations are kept in a property list below "Library/Activities" of the home
/// directory. The rules are `ActivityTable`'s; timer, boot and network are the derived class's.
///
/// The file is read at the first use. Registrations that are lost with a damaged file count as lost in a
/// restart of the device: the post-boot activity is run, whose work it is to register what is pending; and a
/// check-in that says the date it expects is registered for that date. A file that cannot be read is left
/// alone; meanwhile registrations are held in memory.
///
/// Runs are started on the concurrent queue of default priority; after an occasion that has been served, only
/// when the file says so: whoever is killed then must not have it come back after what followed it. Whoever
/// destroys it has ended the queues.
class FileActivityScheduler : public ActivityScheduler {
 public:
  std::unique_ptr<Activity> newActivity(std::string identifier) override;
  void suspend() override;
  void resume() override;

  /// From here on no run is started, and those under way are asked to defer. Any thread.
  void beginEnding();
  /// Runs handed to the queue whose end has not been told. Any thread.
  std::size_t runsUnderWay() const;

 protected:
  FileActivityScheduler(PropertyListFiles& lists, const Clock& clock, WorkQueues& queues, Random& random,
                        const DeviceProperties& device, Log& log, const std::string& mainBundleIdentifier,
                        ActivityOccasions occasions);

  /// Seconds by a clock that nobody moves and that counts while the device is suspended.
  virtual double uptime() const = 0;
  virtual std::string bootIdentifier() const = 0;
  /// Has `startDue` called after so many seconds and whenever the wall clock is moved before; nothing: never.
  /// In the place of what was armed before. Called on any thread, one at a time.
  virtual void arm(std::optional<double> wait) = 0;

  /// Starts what is due, and arms for what will be.
  void startDue();
  /// Reachable until told otherwise.
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

  std::once_flag loaded_;     ///< the file, before anything else is done with the table
  std::mutex saving_;         ///< held while the file is written; taken before `mutex_`
  mutable std::mutex mutex_;  ///< guards what follows
  ActivityTable table_;
  bool unreadable_ = false;  ///< the file, so far: nothing may be written in its place
  bool registrationsLost_ = false;
  bool networkReachable_ = true;
  int suspensions_ = 0;
  bool ending_ = false;

  /// Ends first: what goes with the rest finds nobody to tell.
  const std::shared_ptr<const bool> life_ = std::make_shared<const bool>(true);
};

}  // namespace kvr
