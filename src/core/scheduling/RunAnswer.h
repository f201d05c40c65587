#pragma once

#include "core/scheduling/KVRScheduler.h"
#include "platform/log/Log.h"
#include "platform/services/ActivityScheduler.h"
#include "platform/services/WorkQueues.h"

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <utility>

namespace kvr {

/// The answer to a run that may be deferred while its work is still going on. The first answer counts; a
/// later one, given when the work is done, is dropped with a debug log line. Any thread.
class RunAnswer {
 public:
  RunAnswer(Log& log, ActivityHandler handler) : log_(log), handler_(std::move(handler)) {}

  void give(ActivityResult result) {
    if (isGiven_.exchange(true)) {
      log_.debug("activity run was answered already, result %d dropped", static_cast<std::int64_t>(result));
    } else {
      handler_(result);
    }
  }

 private:
  Log& log_;
  const ActivityHandler handler_;
  std::atomic<bool> isGiven_{false};
};

/// A timer that checks, very rarely, whether the platform asks to defer the run, and then calls `defer` on
/// the main queue. It holds weak references only, so it does not keep a run alive whose answer was dropped.
template <class Owner>
std::shared_ptr<Timer> newDeferCheck(WorkQueues& queues, std::weak_ptr<Owner> owner,
                                     std::weak_ptr<RunAnswer> answer, std::weak_ptr<KVRScheduler> scheduler,
                                     std::function<void(Owner&, RunAnswer&)> defer) {
  constexpr double kInterval = 2'000'000'000;  // seconds
  return queues.newRepeatingTimer(kInterval, queues.mainQueue(),
                                  [owner = std::move(owner), answer = std::move(answer),
                                   scheduler = std::move(scheduler), defer = std::move(defer)] {
                                    const auto self = owner.lock();
                                    const auto pending = answer.lock();
                                    const auto running = scheduler.lock();
                                    if (self && pending && running && running->shouldDefer())
                                      defer(*self, *pending);
                                  });
}

}  // namespace kvr
