#pragma once

#include "platform/log/Log.h"
#include "platform/services/WorkQueues.h"

#include <functional>
#include <memory>

namespace kvr {

/// Bounds how many look-ups of all devices a monitor has under way. Anyone may post notifications, and a
/// service may leave requests without an answer: beyond `kMost`, what is notified is made up for by one more,
/// afterwards, which the log says. Any thread.
class RefreshLimit {
 public:
  static constexpr int kMost = 16;

  RefreshLimit(Log& log, WorkQueueRef queue);

  /// A token to be held while a look-up is under way. Nothing when there are too many: `again` then runs on
  /// the queue when one of them has ended, once however often it was wanted.
  std::shared_ptr<void> begin(std::function<void()> again);

 private:
  struct State;
  const std::shared_ptr<State> state_;
};

}  // namespace kvr
