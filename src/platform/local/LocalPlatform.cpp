#include "platform/local/LocalPlatform.h"

namespace kvr {

LocalPlatform::LocalPlatform(EventLoop& mainLoop, std::function<void()> busLost)
    : queues(mainLoop, *log),
      services(queues, *log, entitlements, std::move(busLost)),
      activities(mainLoop, root, clock, queues, random, deviceProperties, *log, kMainBundleIdentifier,
                 {"com.tarsil.kvragent.upgrade", "com.tarsil.kvragent.boot"}, {}),
      changes(mainLoop, *log, root, locale, pairedDevices, notifications),
      cleanExit(mainLoop, queues, activities, http, services, *log, kMainBundleIdentifier) {}

void LocalPlatform::beginEnding() {
  log->beginEnding();
  activities.beginEnding();
  notifications.beginEnding();
}

bool LocalPlatform::end(double limit) {
  beginEnding();
  services.beginEnding();
  http.beginEnding();
  queues.beginEnding();
  return queues.drain(limit);
}

}  // namespace kvr
