#pragma once

#include "core/devices/DeviceInfosQuery.h"
#include "core/monitors/RefreshLimit.h"
#include "platform/Platform.h"
#include "platform/value/AtomicProperty.h"

#include <memory>

namespace kvr {

/// Keeps the texts of follow-ups in the user's language. 5 seconds after each change of the language, it
/// looks up all warranties again if a follow-up is shown. After that, or at once if none is shown, it
/// requests a clean exit, so that the next start uses the new language throughout. Each notification is
/// handled on its own, unless too many look-ups are under way (`RefreshLimit`).
class KVRLocaleMonitor : public std::enable_shared_from_this<KVRLocaleMonitor> {
 public:
  static std::shared_ptr<KVRLocaleMonitor> initWithAgent(Platform& platform, DeviceInfosQuery agent);
  /// Use `initWithAgent`.
  KVRLocaleMonitor(Platform& platform, DeviceInfosQuery agent);
  ~KVRLocaleMonitor();
  KVRLocaleMonitor(const KVRLocaleMonitor&) = delete;
  KVRLocaleMonitor& operator=(const KVRLocaleMonitor&) = delete;

  /// Call it once.
  void start();
  /// The check after a change. Runs on the main queue.
  void localeDidChange();

  AtomicProperty<DeviceInfosQuery> agent;

 private:
  Platform& platform_;
  RefreshLimit refreshes_;
  Notifications::Token _languageNotifyToken = 0;
};

}  // namespace kvr
