#pragma once

#include "platform/stores/FileActivityScheduler.h"
#include "simulated/loop/SimulatedClock.h"
#include "simulated/loop/SimulatedWorkQueues.h"

namespace kvr {

/// Background activities in virtual time, on simulated files.
class SimulatedActivityScheduler : public FileActivityScheduler {
 public:
  SimulatedActivityScheduler(PropertyListFiles& lists, SimulatedClock& clock, SimulatedWorkQueues& queues,
                             Random& random, const DeviceProperties& device, Log& log,
                             const std::string& mainBundleIdentifier, ActivityOccasions occasions);
  ~SimulatedActivityScheduler() override;
  SimulatedActivityScheduler(const SimulatedActivityScheduler&) = delete;
  SimulatedActivityScheduler& operator=(const SimulatedActivityScheduler&) = delete;

  /// Another value means another boot; it counts from the next check-in of the post-boot activity.
  std::string boot = "B0071D00-0000-4000-8000-000000000001";

  using FileActivityScheduler::setNetworkReachable;

 protected:
  double uptime() const override { return clock_.elapsed(); }
  std::string bootIdentifier() const override { return boot; }
  void arm(std::optional<double> wait) override;

 private:
  SimulatedClock& clock_;
  SimulatedWorkQueues& queues_;
  std::optional<double> armed_;  ///< when the next event starts due activities, in uptime
};

}  // namespace kvr
