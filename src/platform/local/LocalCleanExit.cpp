#include "platform/local/LocalCleanExit.h"

#include <unistd.h>

#include <algorithm>
#include <cstdlib>

namespace kvr {
namespace {

// Between two looks, in seconds: from the first to the last.
constexpr double kFirstPatience = 0.05;
constexpr double kLongestPatience = 10;

/// Whether this very process is one that a service manager started, which starts it again after a clean exit.
bool isManagedService() {
  const char* const process = std::getenv("SYSTEMD_EXEC_PID");
  return process != nullptr && process == std::to_string(::getpid());
}

}  // namespace

void LocalCleanExit::requestWhenIdle() {
  loop_.post([this] { begin(); });
}

bool LocalCleanExit::wouldBeStartedAgain() { return isManagedService() || services_.isActivatable(name_); }

void LocalCleanExit::begin() {
  if (requested_) return;
  if (!wouldBeStartedAgain()) {
    log_.debug("clean exit requested; the agent stays, for nothing would start it again");
    return;
  }
  requested_ = true;
  look(kFirstPatience);
}

bool LocalCleanExit::isIdle() const {
  return activities_.runsUnderWay() == 0 && services_.openCalls() == 0 && http_.openRequests() == 0 &&
         queues_.outstanding() == 0 && loop_.delayed() == 0;
}

void LocalCleanExit::look(double patience) {
  if (isIdle() && !nameGivenUp_) {
    nameGivenUp_ = true;
    services_.beginEnding();
  }
  if (isIdle() && nameGivenUp_) return loop_.exit(EXIT_SUCCESS);
  loop_.after(patience, [this, next = std::min(2 * patience, kLongestPatience)] { look(next); });
}

}  // namespace kvr
