#pragma once

#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace kvr {

using Work = std::function<void()>;

/// Runs work items asynchronously. An item is released right after it ran, on the same thread. An exception
/// that leaves an item is logged and ends that item only.
class WorkQueue {
 public:
  virtual ~WorkQueue() = default;
  /// Adds one item, from any thread. Called on this same queue, if it is serial, it returns before the item
  /// runs.
  virtual void async(Work work) = 0;
};

using WorkQueueRef = std::shared_ptr<WorkQueue>;

enum class Priority { Default, Background };

/// A repeating timer, stopped by `invalidate` or by destroying it. A firing that is already queued may still
/// run. Firings do not pile up: while one is queued, no other is added.
class Timer {
 public:
  virtual ~Timer() = default;
  virtual void invalidate() = 0;
};

/// A one-time event: once signalled, it stays signalled. Any thread may signal; any number may wait.
class Signal {
 public:
  virtual ~Signal() = default;
  virtual void signal() = 0;
  /// Blocks until signalled (true), or until `limit` seconds (if given) have passed or the process is ending
  /// (false). Do not call it on the main queue.
  virtual bool wait(std::optional<double> limit) = 0;
};

/// Gives one operation at a time its turn: whoever locks it waits until the others have unlocked it.
///
/// For operations that change files or preferences, post items or hand over work while they have their turn.
/// It may be locked again within a turn; unlock it on the thread that locked it.
class Turns {
 public:
  virtual ~Turns() = default;
  virtual void lock() = 0;
  virtual void unlock() = 0;
};

/// One turn; it ends when this is destroyed.
using Turn = std::unique_lock<Turns>;

/// Turns among the threads of a process.
class ThreadTurns : public Turns {
 public:
  void lock() override { mutex_.lock(); }
  void unlock() override { mutex_.unlock(); }

 private:
  std::recursive_mutex mutex_;
};

/// The queues, timers, waits and turns of one process.
///
/// Serial queues (the main queue is one) run one item at a time, in the order added. Concurrent queues run
/// items in parallel. Blocked items do not stop others: further threads are started in their place. Delays
/// are in seconds and count while the device sleeps; a negative or undefined delay counts as 0.
class WorkQueues {
 public:
  virtual ~WorkQueues() = default;
  virtual WorkQueueRef mainQueue() = 0;
  /// A new serial queue; it lives until the last reference is gone and its items have run.
  virtual WorkQueueRef newSerialQueue(std::string label) = 0;
  virtual WorkQueueRef concurrentQueue(Priority priority) = 0;
  /// Hands `work` to `queue` once `delay` seconds have passed.
  virtual void after(double delay, WorkQueueRef queue, Work work) = 0;
  /// Hands `work` to `queue` every `interval` seconds, first after one interval.
  virtual std::shared_ptr<Timer> newRepeatingTimer(double interval, WorkQueueRef queue, Work work) = 0;
  virtual std::shared_ptr<Signal> newSignal() = 0;
  /// Locks that guard operations come from here too, so that the simulation sees who has a turn and who waits
  /// for it, and can let others run in the middle of it. `label` says what is done in turn.
  virtual std::shared_ptr<Turns> newTurns(std::string label) = 0;
};

/// Counts outstanding work and notifies when the count reaches zero. Reusable. Thread-safe.
class WorkGroup {
 public:
  void enter() {
    const std::lock_guard lock(mutex_);
    ++outstanding_;
  }
  /// Ends one `enter`. The last one hands the work of every waiting `notify` to its queue.
  void leave();
  /// Hands `work` to `queue` when nothing is outstanding; at once if nothing is.
  void notify(WorkQueueRef queue, Work work);

 private:
  std::mutex mutex_;
  std::size_t outstanding_ = 0;
  std::vector<std::pair<WorkQueueRef, Work>> notices_;
};

}  // namespace kvr
