#pragma once

#include "core/devices/DeviceInfosQuery.h"
#include "core/monitors/RefreshLimit.h"
#include "platform/Platform.h"
#include "platform/value/AtomicProperty.h"

#include <atomic>
#include <memory>

namespace kvr {

/// Keeps the follow-ups in step with the watches that are paired: whenever one is paired or unpaired, all
/// devices are looked up and their follow-ups refreshed, and the follow-up post activity is scheduled when
/// one of them is waiting for its follow-up. Every notification counts for itself, unless too many look-ups
/// are under way already.
///
/// Its registrations keep it alive until they are let go.
class KVRPairedDevicesMonitor : public std::enable_shared_from_this<KVRPairedDevicesMonitor> {
 public:
  static std::shared_ptr<KVRPairedDevicesMonitor> initWithAgent(Platform& platform, DeviceInfosQuery agent);
  /// Use `initWithAgent`.
  KVRPairedDevicesMonitor(Platform& platform, DeviceInfosQuery agent);
  ~KVRPairedDevicesMonitor();
  KVRPairedDevicesMonitor(const KVRPairedDevicesMonitor&) = delete;
  KVRPairedDevicesMonitor& operator=(const KVRPairedDevicesMonitor&) = delete;

  /// Once.
  void start();
  /// On the main queue.
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
