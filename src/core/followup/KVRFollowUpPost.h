#pragma once

#include "core/devices/DeviceInfosQuery.h"
#include "core/scheduling/KVRSchedulerActivityDelegate.h"
#include "core/scheduling/RunAnswer.h"
#include "platform/value/AtomicProperty.h"

#include <atomic>
#include <memory>
#include <optional>
#include <string>

namespace kvr {

/// Posts the follow-ups that are due, then schedules itself for the next one and, when it posted, the refresh
/// activity. Every run downloads all warranties.
class KVRFollowUpPost : public KVRSchedulerActivityDelegate,
                        public std::enable_shared_from_this<KVRFollowUpPost> {
 public:
  KVRFollowUpPost(Platform& platform, DeviceInfosQuery deviceInfosQuery)
      : platform_(platform), deviceInfosQuery_(std::move(deviceInfosQuery)) {}

  std::string identifier() const override;
  bool requiresNetwork() const override { return true; }
  void performActivityForScheduler(const std::shared_ptr<KVRScheduler>& scheduler,
                                   ActivityHandler withCompletionHandler) override;

  /// When the activity should run next; nothing if no device is waiting for its follow-up, a date in the past
  /// if a device's eligibility ended without one.
  static std::optional<Date> nextFollowUpPostDateWithDevicesInfo(Platform& platform,
                                                                 const KVRDeviceInfoList& devicesInfo);

  /// Checks, very rarely, whether the platform asks to defer the run.
  AtomicProperty<std::shared_ptr<Timer>> followUpPostTimer;
  /// True from the start of a run until its devices are known.
  std::atomic<bool> followUpPostInProgress{false};

 private:
  void defer(RunAnswer& answer);
  void stopDeferCheck();
  void handle(const std::optional<KVRDeviceInfoList>& devicesInfo, RunAnswer& answer);
  void postAndSchedule(const KVRDeviceInfoList& devicesInfo);

  Platform& platform_;
  const DeviceInfosQuery deviceInfosQuery_;
};

}  // namespace kvr
