#pragma once

#include "platform/log/Log.h"
#include "platform/services/WorkQueues.h"

#include <functional>
#include <memory>

namespace kvr {

/// Limits how many look-ups of all devices a monitor has under way: any program can post notifications, and a
/// service may leave requests without an answer. Beyond `kMost`, further notifications are merged into one
/// more look-up afterwards, with a log line. Any thread.
class RefreshLimit {
 public:
  static constexpr int kMost = 16;

  RefreshLimit(Log& log, WorkQueueRef queue);

  /// Returns a token to hold while a look-up is under way, or null if there are too many. Then `again` runs
  /// on the queue when one of them has ended: once, however many calls were refused.
  std::shared_ptr<void> begin(std::function<void()> again);

 private:
  struct State;
  const std::shared_ptr<State> state_;
};

}  // namespace kvr
