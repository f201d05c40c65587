#include "local/loop/WorkPool.h"

#include "local/system/Deadline.h"

#include <signal.h>

#include <algorithm>
#include <chrono>
#include <exception>
#include <system_error>
#include <thread>
#include <utility>

namespace kvr {

namespace {

/// Enough to destroy, compare and write the deepest tree in any build; only the part in use takes memory.
constexpr std::size_t kStackSize = std::size_t{4} << 20;
constexpr unsigned kMostPassedOver = 16;
constexpr double kLongestWait = 1e9;  // seconds; a longer wait has no limit

/// The pool that the present thread belongs to.
thread_local const WorkPool* threadsPool = nullptr;

}  // namespace

class WorkPool::SerialQueue : public WorkQueue, public std::enable_shared_from_this<SerialQueue> {
 public:
  explicit SerialQueue(std::shared_ptr<WorkPool> pool) : pool_(std::move(pool)) {}

  void async(Work work) override {
    Lock lock(pool_->mutex_);
    if (pool_->closed_) return;
    ++pool_->outstanding_;
    items.push_back(std::move(work));
    if (!std::exchange(hasTurn, true)) pool_->submit(lock, pool_->ready_, {shared_from_this(), nullptr});
  }

  // Guarded by the pool's mutex.
  std::deque<Work> items;
  bool hasTurn = false;  ///< it is in the ready list, or one of its items runs

 private:
  const std::shared_ptr<WorkPool> pool_;
};

class WorkPool::ConcurrentQueue : public WorkQueue {
 public:
  ConcurrentQueue(std::shared_ptr<WorkPool> pool, Priority priority)
      : pool_(std::move(pool)),
        turns_(priority == Priority::Background ? pool_->readyInBackground_ : pool_->ready_) {}

  void async(Work work) override {
    Lock lock(pool_->mutex_);
    if (pool_->closed_) return;
    ++pool_->outstanding_;
    pool_->submit(lock, turns_, {nullptr, std::move(work)});
  }

 private:
  const std::shared_ptr<WorkPool> pool_;
  std::deque<Turn>& turns_;
};

class WorkPool::PoolSignal : public Signal, public std::enable_shared_from_this<PoolSignal> {
 public:
  PoolSignal(std::shared_ptr<WorkPool> pool, Alarm alarm)
      : pool_(std::move(pool)), alarm_(std::move(alarm)) {}

  void signal() override {
    const auto self = shared_from_this();
    {
      const Lock lock(pool_->mutex_);
      signalled_ = true;
    }
    changed_.notify_all();
  }

  bool wait(std::optional<double> limit) override {
    if (limit && *limit > kLongestWait) limit.reset();
    const auto expired = std::make_shared<bool>(false);
    std::function<void()> cancelAlarm;
    Lock lock(pool_->mutex_);
    if (signalled_ || pool_->ending_ || (limit && !(*limit > 0))) return signalled_;
    if (limit) {
      lock.unlock();
      // The condition variable's clock stops while the device is suspended; the alarm's clock does not.
      cancelAlarm = alarm_(*limit, [self = shared_from_this(), expired] {
        const Lock alarmLock(self->pool_->mutex_);
        *expired = true;
        self->changed_.notify_all();
      });
      lock.lock();
    }
    block(lock, limit, *expired);
    const bool signalled = signalled_;
    lock.unlock();
    if (cancelAlarm) cancelAlarm();
    return signalled;
  }

 private:
  void block(Lock& lock, std::optional<double> limit, const bool& expired) {
    const auto over = [&] { return signalled_ || expired || pool_->ending_; };
    if (over()) return;
    const bool blocksPool = threadsPool == pool_.get();
    pool_->waits_.push_back(&changed_);
    if (blocksPool) {
      ++pool_->blocked_;
      if (pool_->provideThread()) pool_->wakeUp_.notify_one();
    }
    if (limit) {
      changed_.wait_until(lock, deadlineAfter(*limit), over);
    } else {
      changed_.wait(lock, over);
    }
    if (blocksPool) --pool_->blocked_;
    auto& waits = pool_->waits_;
    waits.erase(std::find(waits.begin(), waits.end(), &changed_));
  }

  const std::shared_ptr<WorkPool> pool_;
  const Alarm alarm_;
  // Guarded by the pool's mutex.
  std::condition_variable changed_;
  bool signalled_ = false;
};

WorkPool::WorkPool(Log& log, Retry retry)
    : log_(log),
      retry_(std::move(retry)),
      mostBusy_(std::max<std::size_t>(kBusyThreads, std::thread::hardware_concurrency())) {}

WorkPool::~WorkPool() = default;

WorkQueueRef WorkPool::newSerialQueue() { return std::make_shared<SerialQueue>(shared_from_this()); }

WorkQueueRef WorkPool::newConcurrentQueue(Priority priority) {
  return std::make_shared<ConcurrentQueue>(shared_from_this(), priority);
}

std::shared_ptr<Signal> WorkPool::newSignal(Alarm alarm) {
  return std::make_shared<PoolSignal>(shared_from_this(), std::move(alarm));
}

std::size_t WorkPool::outstanding() const {
  const Lock lock(mutex_);
  return outstanding_;
}

// Threads.

void WorkPool::submit(Lock& lock, std::deque<Turn>& turns, Turn turn) {
  turns.push_back(std::move(turn));
  const bool calls = provideThread();
  lock.unlock();
  if (calls) wakeUp_.notify_one();
}

/// Makes sure that a thread takes up the ready work; starts one if needed. True when a sleeping thread was
/// chosen: the caller must notify `wakeUp_`. With the mutex held.
bool WorkPool::provideThread() {
  if (ready_.empty() && readyInBackground_.empty()) return false;
  if (idle_ > 0) {
    --idle_;
    ++called_;
    return true;
  }
  if (busy() < mostBusy_ && !startThread() && busy() == 0 && !std::exchange(retrying_, true)) {
    retry_([self = shared_from_this()] {
      const Lock lock(self->mutex_);
      self->retrying_ = false;
      if (self->provideThread()) self->wakeUp_.notify_one();
    });
  }
  return false;
}

bool WorkPool::startThread() {
  pthread_attr_t attributes;
  if (::pthread_attr_init(&attributes) != 0) return false;
  ::pthread_attr_setstacksize(&attributes, kStackSize);
  sigset_t all;
  sigset_t before;
  ::sigfillset(&all);
  ::pthread_sigmask(SIG_SETMASK, &all, &before);
  pthread_t thread{};
  const bool started = ::pthread_create(&thread, &attributes, &WorkPool::threadMain, this) == 0;
  ::pthread_sigmask(SIG_SETMASK, &before, nullptr);
  ::pthread_attr_destroy(&attributes);
  if (started) ++threads_;
  return started;
}

void* WorkPool::threadMain(void* self) noexcept {
  static_cast<WorkPool*>(self)->runThread();
  return nullptr;
}

void WorkPool::runThread() {
  threadsPool = this;
  Lock lock(mutex_);
  // After a wait ends, more threads than allowed may be running; the surplus one ends.
  while (busy() <= mostBusy_) {
    if (Turn turn; takeTurn(turn)) {
      lock.unlock();
      runTurn(turn);
      lock.lock();
    } else if (closed_ || !restsAwhile(lock)) {
      break;
    }
  }
  const auto previous = std::exchange(ended_, ::pthread_self());
  if (--threads_ == 0) allEnded_.notify_all();
  lock.unlock();
  if (previous) ::pthread_join(*previous, nullptr);
}

/// Sleeps until notified; false when enough other threads already sleep.
bool WorkPool::restsAwhile(Lock& lock) {
  if (idle_ >= kIdleThreads) return false;
  ++idle_;
  wakeUp_.wait(lock, [this] { return called_ > 0; });
  --called_;
  return true;
}

bool WorkPool::takeTurn(Turn& turn) {
  const bool backgroundWaits = !readyInBackground_.empty();
  const bool background = backgroundWaits && (ready_.empty() || passedOver_ >= kMostPassedOver);
  auto& turns = background ? readyInBackground_ : ready_;
  if (turns.empty()) return false;
  passedOver_ = background || !backgroundWaits ? 0 : passedOver_ + 1;
  turn = std::move(turns.front());
  turns.pop_front();
  if (turn.queue) {
    turn.work = std::move(turn.queue->items.front());
    turn.queue->items.pop_front();
  }
  return true;
}

/// Runs an item and queues its serial queue for the next one.
void WorkPool::runTurn(Turn& turn) {
  runItem(turn.work);
  // Declared before the lock, so destroyed after it: destroying work may hand over more.
  const auto queue = std::move(turn.queue);
  std::deque<Work> released;
  const Lock lock(mutex_);
  if (queue) {
    if (closed_) queue->items.swap(released);
    queue->hasTurn = !queue->items.empty();
    if (queue->hasTurn) ready_.push_back({queue, nullptr});
  }
  outstanding_ -= 1 + released.size();
  if (outstanding_ == 0) drained_.notify_all();
}

void WorkPool::runItem(Work& work) noexcept {
  try {
    work();
  } catch (const std::exception& error) {
    log_.error("work item failed: %@", error.what());
  } catch (...) {
    log_.error("work item failed: %@", "unknown exception");
  }
  work = nullptr;
}

// Ending.

void WorkPool::beginEnding() {
  const Lock lock(mutex_);
  endWaits();
}

/// With the mutex held.
void WorkPool::endWaits() {
  ending_ = true;
  for (auto* const wait : waits_) wait->notify_all();
}

bool WorkPool::drain(double limit) {
  Lock lock(mutex_);
  const auto isEmpty = [this] { return outstanding_ == 0; };
  if (limit > kLongestWait) {
    drained_.wait(lock, isEmpty);
  } else if (!drained_.wait_until(lock, deadlineAfter(limit > 0 ? limit : 0), isEmpty)) {
    return false;
  }
  closed_ = true;
  lock.unlock();
  stop();
  return true;
}

void WorkPool::stop() {
  std::deque<Turn> turns;
  std::deque<std::deque<Work>> items;
  Lock lock(mutex_);
  closed_ = true;
  endWaits();
  turns.swap(ready_);
  std::move(readyInBackground_.begin(), readyInBackground_.end(), std::back_inserter(turns));
  readyInBackground_.clear();
  for (const auto& turn : turns) {
    outstanding_ -= turn.queue ? turn.queue->items.size() : 1;
    if (turn.queue) items.push_back(std::exchange(turn.queue->items, {}));
  }
  called_ += std::exchange(idle_, 0);
  wakeUp_.notify_all();
  allEnded_.wait(lock, [this] { return threads_ == 0; });
  const auto last = std::exchange(ended_, std::nullopt);
  lock.unlock();
  if (last) ::pthread_join(*last, nullptr);
}

}  // namespace kvr
