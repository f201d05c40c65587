#pragma once

#include "local/device/LocalNetwork.h"
#include "local/system/Descriptor.h"
#include "platform/stores/FileActivityScheduler.h"

namespace kvr {

/// Background activities on this machine.
///
/// Uses one wall-clock timer, set for the next activity only; the kernel ends it early when the clock is set.
/// A deferral waits in boot time, which is recomputed whenever the timer ends. Built and destroyed on the
/// loop's thread.
class LocalActivityScheduler : public FileActivityScheduler {
 public:
  /// The files in which the host publishes its state.
  struct HostFiles {
    std::string bootIdentifier = "/proc/sys/kernel/random/boot_id";
    std::string networkState = LocalNetwork::kHostState;
  };

  /// Throws std::system_error when the kernel refuses a descriptor.
  LocalActivityScheduler(EventLoop& loop, const DeviceRoot& root, const Clock& clock, WorkQueues& queues,
                         Random& random, const DeviceProperties& device, Log& log,
                         const std::string& mainBundleIdentifier, ActivityOccasions occasions,
                         HostFiles host);
  ~LocalActivityScheduler() override;
  LocalActivityScheduler(const LocalActivityScheduler&) = delete;
  LocalActivityScheduler& operator=(const LocalActivityScheduler&) = delete;

 protected:
  double uptime() const override;
  std::string bootIdentifier() const override;
  void arm(std::optional<double> wait) override;

 private:
  void timerEnded() noexcept;

  const HostFiles host_;
  const Descriptor timer_;
  sd_event_source* source_ = nullptr;
  LocalNetwork network_;
};

}  // namespace kvr
