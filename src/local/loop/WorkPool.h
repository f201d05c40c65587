#pragma once

#include "platform/log/Log.h"
#include "platform/services/WorkQueues.h"

#include <pthread.h>

#include <condition_variable>
#include <cstddef>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <vector>

namespace kvr {

/// The threads that run all queues but the main one.
///
/// At most `kBusyThreads` (or one per core, if that is more) run items. A thread that waits inside an item
/// does not count: another one takes its place, however many wait. A thread with nothing to do ends, except
/// for `kIdleThreads` that sleep until needed. All operations can be called from any thread.
class WorkPool : public std::enable_shared_from_this<WorkPool> {
 public:
  static constexpr std::size_t kBusyThreads = 4;
  static constexpr std::size_t kIdleThreads = 2;

  /// Runs the given work on a thread outside the pool after a moment; used when no thread could be created.
  using Retry = std::function<void(Work)>;

  WorkPool(Log& log, Retry retry);
  /// `stop` must have been called.
  ~WorkPool();
  WorkPool(const WorkPool&) = delete;
  WorkPool& operator=(const WorkPool&) = delete;

  WorkQueueRef newSerialQueue();
  WorkQueueRef newConcurrentQueue(Priority priority);
  /// A signal that can be waited for on the pool's threads and others. `alarm` runs the work after `delay`
  /// seconds of boot time and returns a function that cancels it.
  using Alarm = std::function<std::function<void()>(double delay, Work work)>;
  std::shared_ptr<Signal> newSignal(Alarm alarm);

  /// Items queued or running.
  std::size_t outstanding() const;
  /// Ends all waits; later waits end at once.
  void beginEnding();
  /// Waits until no item is queued or running, then stops. False, without stopping, when that takes more than
  /// `limit` seconds.
  bool drain(double limit);
  /// Ends all waits, lets running items finish, joins the threads and drops queued items. Later items are
  /// dropped at once. Not on one of the pool's own threads.
  void stop();

 private:
  class SerialQueue;
  class ConcurrentQueue;
  class PoolSignal;
  /// An item of a concurrent queue, or a serial queue whose turn it is.
  struct Turn {
    std::shared_ptr<SerialQueue> queue;
    Work work;
  };
  using Lock = std::unique_lock<std::mutex>;

  static void* threadMain(void* self) noexcept;
  void runThread();
  bool takeTurn(Turn& turn);
  void runTurn(Turn& turn);
  bool restsAwhile(Lock& lock);
  void runItem(Work& work) noexcept;
  void submit(Lock& lock, std::deque<Turn>& turns, Turn turn);
  std::size_t busy() const { return threads_ - idle_ - blocked_; }
  bool provideThread();
  void endWaits();
  bool startThread();

  Log& log_;
  const Retry retry_;
  const std::size_t mostBusy_;

  mutable std::mutex mutex_;  ///< guards what follows and the state of queues and signals
  std::deque<Turn> ready_;
  std::deque<Turn> readyInBackground_;
  unsigned passedOver_ = 0;  ///< turns taken since the background last had one
  std::size_t outstanding_ = 0;

  std::size_t threads_ = 0;
  std::size_t idle_ = 0;            ///< sleeping threads that have not been notified
  std::size_t called_ = 0;          ///< notified threads that have not woken up yet
  std::size_t blocked_ = 0;         ///< threads that wait inside an item
  std::optional<pthread_t> ended_;  ///< the thread that ended last; the next one to end joins it
  bool retrying_ = false;
  std::condition_variable wakeUp_;
  std::condition_variable drained_;
  std::condition_variable allEnded_;

  std::vector<std::condition_variable*> waits_;  ///< the waits under way
  bool ending_ = false;
  bool closed_ = false;
};

}  // namespace kvr
