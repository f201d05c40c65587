#include "platform/local/LocalPlatform.h"

namespace kvr {

LocalPlatform::LocalPlatform(EventLoop& mainLoop, std::function<void()> busLost)
    : queues(mainLoop, *log), services(queues, *log, entitlements, std::move(busLost)) {}

bool LocalPlatform::end(double limit) {
  log->beginEnding();
  services.beginEnding();
  http.beginEnding();
  queues.beginEnding();
  return queues.drain(limit);
}

}  // namespace kvr
