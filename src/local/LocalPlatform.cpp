#include "local/LocalPlatform.h"

#include "platform/names/Names.h"

#include <chrono>
#include <utility>

namespace kvr {

LocalPlatform::LocalPlatform(EventLoop& mainLoop, std::unique_ptr<LocalLog> theLog,
                             std::function<void()> busLost)
    : log(std::move(theLog)),
      queues(mainLoop, *log),
      services(queues, *log, entitlements, std::move(busLost)),
      activities(mainLoop, root, clock, queues, random, deviceProperties, *log, names::kAgent,
                 {names::kPostUpgrade, names::kPostBoot}, {}),
      changes(mainLoop, *log, root, locale, pairedDevices, notifications, &services.observers()),
      cleanExit(mainLoop, queues, activities, http, services, *log, names::kAgent) {}

void LocalPlatform::beginEnding() {
  cleanExit.beginEnding();
  log->beginEnding();
  activities.beginEnding();
  notifications.beginEnding();
}

bool LocalPlatform::end(double limit) {
  const auto start = std::chrono::steady_clock::now();
  beginEnding();
  services.beginEnding();
  http.beginEnding();
  store.beginEnding();
  queues.beginEnding();
  // First wait for the last answers: handling them adds work to the queues.
  if (!http.drain(limit)) return false;
  return queues.drain(limit -
                      std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count());
}

}  // namespace kvr
