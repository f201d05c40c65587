#pragma once

#include "core/devices/DeviceInfosQuery.h"
#include "core/monitors/RefreshLimit.h"
#include "platform/Platform.h"
#include "platform/value/AtomicProperty.h"

#include <atomic>
#include <memory>

namespace kvr {

/// Keeps the follow-ups up to date with the paired watches. Whenever a watch is paired or unpaired, it looks
/// up all devices and refreshes their follow-ups, and schedules the follow-up post activity if a device is
/// waiting for its follow-up. Each notification is handled on its own, unless too many look-ups are under way
/// (`RefreshLimit`).
///
/// Its notification handlers keep it alive until they are cancelled.
class KVRPairedDevicesMonitor : public std::enable_shared_from_this<KVRPairedDevicesMonitor> {
 public:
  static std::shared_ptr<KVRPairedDevicesMonitor> initWithAgent(Platform& platform, DeviceInfosQuery agent);
  /// Use `initWithAgent`.
  KVRPairedDevicesMonitor(Platform& platform, DeviceInfosQuery agent);
  ~KVRPairedDevicesMonitor();
  KVRPairedDevicesMonitor(const KVRPairedDevicesMonitor&) = delete;
  KVRPairedDevicesMonitor& operator=(const KVRPairedDevicesMonitor&) = delete;

  /// Call it once.
  void start();
  /// Runs on the main queue.
  void _pairedOrActiveDevicesDidChange();
  void _updatePariedDevicesFollowUp();

  std::atomic<Notifications::Token> pairNotifyToken{0};
  std::atomic<Notifications::Token> unpairNotifyToken{0};
  AtomicProperty<DeviceInfosQuery> agent;

 private:
  void schedulePost(const KVRDeviceInfoList& deviceInfos);

  Platform& platform_;
  RefreshLimit refreshes_;
};

}  // namespace kvr
