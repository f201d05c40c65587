#include "core/monitors/RefreshLimit.h"

#include <mutex>
#include <utility>

namespace kvr {

struct RefreshLimit::State {
  void end() {
    std::function<void()> again;
    {
      const std::lock_guard lock(mutex);
      --underWay;
      again = std::exchange(owed, nullptr);
    }
    if (again) queue->async(std::move(again));
  }

  Log& log;
  const WorkQueueRef queue;
  std::mutex mutex;  ///< guards the members below
  int underWay = 0;
  std::function<void()> owed;
};

RefreshLimit::RefreshLimit(Log& log, WorkQueueRef queue)
    : state_(new State{log, std::move(queue), {}, 0, nullptr}) {}

std::shared_ptr<void> RefreshLimit::begin(std::function<void()> again) {
  {
    const std::lock_guard lock(state_->mutex);
    if (state_->underWay == kMost) {
      if (!state_->owed) {
        state_->log.standard("%d look-ups after notifications are under way, one makes up for what follows",
                             kMost);
      }
      state_->owed = std::move(again);
      return nullptr;
    }
    ++state_->underWay;
  }
  return {state_.get(), [state = state_](const void*) { state->end(); }};
}

}  // namespace kvr
