#pragma once

#include "core/devices/DeviceInfosQuery.h"
#include "core/monitors/RefreshLimit.h"
#include "platform/Platform.h"
#include "platform/value/AtomicProperty.h"

#include <memory>

namespace kvr {

/// Keeps the texts of follow-ups in the user's language: 5 seconds after every change of it, the warranties
/// are looked up anew while a follow-up is shown. Then, or when none is, the process may end once it is idle,
/// so that its next start is in the new language altogether. Every notification counts for itself, unless too
/// many look-ups are under way already.
class KVRLocaleMonitor : public std::enable_shared_from_this<KVRLocaleMonitor> {
 public:
  static std::shared_ptr<KVRLocaleMonitor> initWithAgent(Platform& platform, DeviceInfosQuery agent);
  /// Use `initWithAgent`.
  KVRLocaleMonitor(Platform& platform, DeviceInfosQuery agent);
  ~KVRLocaleMonitor();
  KVRLocaleMonitor(const KVRLocaleMonitor&) = delete;
  KVRLocaleMonitor& operator=(const KVRLocaleMonitor&) = delete;

  /// Once.
  void start();
  /// The check. On the main queue.
  void localeDidChange();

  AtomicProperty<DeviceInfosQuery> agent;

 private:
  Platform& platform_;
  RefreshLimit refreshes_;
  Notifications::Token _languageNotifyToken = 0;
};

}  // namespace kvr
