#pragma once

#include "core/devices/DeviceInfosQuery.h"
#include "core/scheduling/KVRSchedulerActivityDelegate.h"

#include <memory>
#include <optional>
#include <string>

namespace kvr {

/// Brings the shown follow-ups up to date from the cache, and schedules itself for the next moment at which
/// one of them changes, as long as any is shown.
class KVRFollowUpRefresh : public KVRSchedulerActivityDelegate,
                           public std::enable_shared_from_this<KVRFollowUpRefresh> {
 public:
  KVRFollowUpRefresh(Platform& platform, DeviceInfosQuery deviceInfosQuery)
      : platform_(platform), deviceInfosQuery_(std::move(deviceInfosQuery)) {}

  std::string identifier() const override;
  bool requiresNetwork() const override { return false; }
  void performActivityForScheduler(const std::shared_ptr<KVRScheduler>& scheduler,
                                   ActivityHandler withCompletionHandler) override;

  /// When the activity should run next. May be nothing for an initial call; otherwise it is a day from now at
  /// the latest.
  static std::optional<Date> nextFollowUpRefreshDateWithDevicesInfo(Platform& platform,
                                                                    const KVRDeviceInfoList& devicesInfo,
                                                                    bool isInitialCall);
  /// The date for an initial call, or if that is nothing, a day from now at the latest.
  static Date _refreshDateWithDevicesInfo(Platform& platform, const KVRDeviceInfoList& devicesInfo);

 private:
  void refreshAndSchedule(const KVRDeviceInfoList& devicesInfo);

  Platform& platform_;
  const DeviceInfosQuery deviceInfosQuery_;
};

}  // namespace kvr
