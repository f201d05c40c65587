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

/// Starts the agent, on the main thread, and owns the objects that live until the process ends. The order is
/// fixed: preference defaults, activities, the settings application's agent, migration, monitors, and the bus
/// service last, so that clients are served only when everything else is ready. Activities are suspended
/// until then: migration has the cache to itself, and a boot and an upgrade are both noticed before either is
/// served. The caller then runs the main loop.
class StartUp {
 public:
  /// Writes the first line of the log. Call it before building the platform, which may log too.
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
