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
/// At most `kBusyThreads` (or one a core, if there are more) run items; a thread that waits inside an item
/// does not count, another takes its place, however many wait. A thread with nothing to do ends, but for
/// `kIdleThreads` that sleep until they are needed. Any thread may call any operation.
class WorkPool : public std::enable_shared_from_this<WorkPool> {
 public:
  static constexpr std::size_t kBusyThreads = 4;
  static constexpr std::size_t kIdleThreads = 2;

  /// Hands `retry` work that should be run on some other thread after a moment; used when no thread could be
  /// made.
  using Retry = std::function<void(Work)>;

  WorkPool(Log& log, Retry retry);
  /// `stop` must have been called.
  ~WorkPool();
  WorkPool(const WorkPool&) = delete;
  WorkPool& operator=(const WorkPool&) = delete;

  WorkQueueRef newSerialQueue();
  WorkQueueRef newConcurrentQueue(Priority priority);
  /// A signal that can be waited for on the pool's threads and others. `alarm` calls its work after so many
  /// seconds of boot time, and what it returns takes that back.
  using Alarm = std::function<std::function<void()>(double delay, Work work)>;
  std::shared_ptr<Signal> newSignal(Alarm alarm);

  /// Items queued or running.
  std::size_t outstanding() const;
  /// Ends all waits, and every later one at once.
  void beginEnding();
  /// Waits until no item is queued or running and stops then; false when that took longer than `limit`
  /// seconds.
  bool drain(double limit);
  /// Ends all waits, lets running items finish, joins the threads and releases what is queued. What is handed
  /// over later is released at once. Not on one of the pool's own threads.
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
  std::size_t idle_ = 0;            ///< threads that sleep and have not been called
  std::size_t called_ = 0;          ///< threads that have been called and not woken up yet
  std::size_t blocked_ = 0;         ///< threads that wait inside an item
  std::optional<pthread_t> ended_;  ///< the thread that ended last; the next one to end joins it
  bool retrying_ = false;
  std::condition_variable wakeUp_;
  std::condition_variable drained_;
  std::condition_variable allEnded_;

  std::vector<std::condition_variable*> waits_;  ///< those under way
  bool ending_ = false;
  bool closed_ = false;
};

}  // namespace kvr
