#include "platform/services/WorkQueues.h"

namespace kvr {

void WorkGroup::leave() {
  std::vector<std::pair<WorkQueueRef, Work>> due;
  {
    const std::lock_guard lock(mutex_);
    if (--outstanding_ == 0) due.swap(notices_);
  }
  for (auto& [queue, work] : due) queue->async(std::move(work));
}

void WorkGroup::notify(WorkQueueRef queue, Work work) {
  {
    const std::lock_guard lock(mutex_);
    if (outstanding_ != 0) {
      notices_.emplace_back(std::move(queue), std::move(work));
      return;
    }
  }
  queue->async(std::move(work));
}

}  // namespace kvr
