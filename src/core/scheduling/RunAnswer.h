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

/// The answer to an activity's run that may be deferred while its work is under way. The first one counts;
/// the work's own, when it comes after, is dropped with a debug line. Any thread.
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

/// Looks, very rarely, whether the platform wants the run deferred; `defer` is then called on the main queue.
/// Keeps nothing alive: a run whose answer is dropped on the way has come to its end.
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
