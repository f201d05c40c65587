#pragma once

#include "platform/ActivityScheduler.h"
#include "platform/Log.h"

#include <atomic>
#include <cstdint>
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

}  // namespace kvr
