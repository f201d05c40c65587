#pragma once

#include "core/agent/KVRAgent.h"
#include "core/agent/ServiceDelegate.h"
#include "core/monitors/KVRLocaleMonitor.h"
#include "core/monitors/KVRPairedDevicesMonitor.h"
#include "core/scheduling/KVRScheduler.h"
#include "platform/Platform.h"

#include <memory>
#include <vector>

namespace kvr {

/// Brings the agent up in its fixed order, on the main thread, and holds what lives until the process ends:
/// defaults, activities, the settings application's agent, migration, monitors, and last the named service,
/// so that no client is served before all else stands. No activity runs before: migration has the cache to
/// itself, and of the occasions that have come none is served before all are known. The caller then runs the
/// main loop.
class StartUp {
 public:
  /// The first line of the log. The caller writes it before the platform is built, which may have something
  /// to say.
  static void announce(Log& log);
  explicit StartUp(Platform& platform);

 private:
  static void resumePosts(Platform& platform);
  void resumeRefreshes(Platform& platform);
  void monitor(Platform& platform, const char* activity);

  std::vector<std::shared_ptr<KVRScheduler>> schedulers_;
  std::shared_ptr<KVRAgent> agent_;
  std::shared_ptr<KVRLocaleMonitor> localeMonitor_;
  std::shared_ptr<KVRPairedDevicesMonitor> pairedDevicesMonitor_;
  ServiceDelegate delegate_;
  std::unique_ptr<ServiceListener> listener_;
};

}  // namespace kvr
