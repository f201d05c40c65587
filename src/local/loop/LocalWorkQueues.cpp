#include "local/loop/LocalWorkQueues.h"

#include <algorithm>
#include <atomic>
#include <mutex>
#include <utility>

namespace kvr {

namespace {

constexpr double kShortestInterval = 0.001;  // seconds
constexpr double kThreadRetryDelay = 1;      // seconds

}  // namespace

class LocalWorkQueues::MainQueue : public WorkQueue {
 public:
  explicit MainQueue(EventLoop& main) : main_(main) {}
  void async(Work work) override { main_.post(std::move(work)); }

 private:
  EventLoop& main_;
};

class LocalWorkQueues::RepeatingTimer : public Timer, public std::enable_shared_from_this<RepeatingTimer> {
 public:
  RepeatingTimer(EventLoop& main, double interval, WorkQueueRef queue, Work work)
      : main_(main),
        interval_(interval > kShortestInterval ? interval : kShortestInterval),
        firing_(std::make_shared<Firing>()),
        queue_(std::move(queue)) {
    firing_->work = std::move(work);
  }
  ~RepeatingTimer() override { end(); }
  RepeatingTimer(const RepeatingTimer&) = delete;
  RepeatingTimer& operator=(const RepeatingTimer&) = delete;

  void scheduleNext() {
    const std::lock_guard lock(mutex_);
    if (!firing_) return;
    next_ = main_.after(interval_, [weak = weak_from_this()] {
      if (const auto self = weak.lock()) self->fire();
    });
  }
  void invalidate() override { end(); }

 private:
  struct Firing {
    Work work;
    std::atomic<bool> waits{false};  ///< handed to the queue and not begun
  };

  void end() {
    WorkQueueRef queue;
    std::shared_ptr<Firing> firing;
    const std::lock_guard lock(mutex_);
    queue.swap(queue_);
    firing.swap(firing_);
    if (firing) main_.cancel(next_);
  }

  void fire() {
    scheduleNext();
    WorkQueueRef queue;
    std::shared_ptr<Firing> firing;
    {
      const std::lock_guard lock(mutex_);
      queue = queue_;
      firing = firing_;
    }
    // At most one firing waits in a queue that is behind.
    if (!firing || firing->waits.exchange(true)) return;
    queue->async([firing = std::move(firing)] {
      firing->waits = false;
      firing->work();
    });
  }

  EventLoop& main_;
  const double interval_;
  std::mutex mutex_;  ///< guards what follows, which is empty once invalidated
  std::shared_ptr<Firing> firing_;
  WorkQueueRef queue_;
  EventLoop::TimerKey next_;
};

LocalWorkQueues::LocalWorkQueues(EventLoop& main, Log& log)
    : main_(main),
      pool_(std::make_shared<WorkPool>(
          log, [&main](Work work) { main.after(kThreadRetryDelay, std::move(work)); })),
      mainQueue_(std::make_shared<MainQueue>(main)),
      concurrentQueue_(pool_->newConcurrentQueue(Priority::Default)),
      backgroundQueue_(pool_->newConcurrentQueue(Priority::Background)) {
  main_.setFailureHandler([&log](const std::string& what) { log.error("work item failed: %@", what); });
}

LocalWorkQueues::~LocalWorkQueues() {
  pool_->stop();
  main_.setFailureHandler(nullptr);
}

WorkQueueRef LocalWorkQueues::newSerialQueue(std::string /*label*/) { return pool_->newSerialQueue(); }

WorkQueueRef LocalWorkQueues::concurrentQueue(Priority priority) {
  return priority == Priority::Background ? backgroundQueue_ : concurrentQueue_;
}

void LocalWorkQueues::after(double delay, WorkQueueRef queue, Work work) {
  main_.after(
      delay, [queue = std::move(queue), work = std::move(work)]() mutable { queue->async(std::move(work)); });
}

std::shared_ptr<Timer> LocalWorkQueues::newRepeatingTimer(double interval, WorkQueueRef queue, Work work) {
  auto timer = std::make_shared<RepeatingTimer>(main_, interval, std::move(queue), std::move(work));
  timer->scheduleNext();
  return timer;
}

std::shared_ptr<Signal> LocalWorkQueues::newSignal() {
  return pool_->newSignal([&main = main_](double delay, Work work) {
    return [&main, key = main.after(delay, std::move(work))] { main.cancel(key); };
  });
}

std::shared_ptr<Turns> LocalWorkQueues::newTurns(std::string /*label*/) {
  return std::make_shared<ThreadTurns>();
}

std::size_t LocalWorkQueues::outstanding() const { return pool_->outstanding() + main_.pending(); }

void LocalWorkQueues::beginEnding() { pool_->beginEnding(); }

bool LocalWorkQueues::drain(double limitSeconds) { return pool_->drain(limitSeconds); }

}  // namespace kvr
