#pragma once

#include "local/loop/EventLoop.h"
#include "local/loop/WorkPool.h"
#include "platform/log/Log.h"
#include "platform/services/WorkQueues.h"

#include <cstddef>
#include <memory>
#include <string>

namespace kvr {

/// Work queues on real threads: the main queue runs on the main event loop, all others share one thread pool.
/// Delays are timers of the main event loop. Nothing wakes up while there is nothing to do.
///
/// To end: `beginEnding`, leave the loop, `drain`, destroy.
class LocalWorkQueues : public WorkQueues {
 public:
  /// On the loop's thread. The loop and the log must outlive this.
  LocalWorkQueues(EventLoop& main, Log& log);
  /// Lets running items finish, joins all threads and drops queued work. On the loop's thread.
  ~LocalWorkQueues() override;
  LocalWorkQueues(const LocalWorkQueues&) = delete;
  LocalWorkQueues& operator=(const LocalWorkQueues&) = delete;

  WorkQueueRef mainQueue() override { return mainQueue_; }
  WorkQueueRef newSerialQueue(std::string label) override;
  WorkQueueRef concurrentQueue(Priority priority) override;
  void after(double delay, WorkQueueRef queue, Work work) override;
  std::shared_ptr<Timer> newRepeatingTimer(double interval, WorkQueueRef queue, Work work) override;
  std::shared_ptr<Signal> newSignal() override;
  std::shared_ptr<Turns> newTurns(std::string label) override;

  /// Items queued or running, except the one running on the main thread (which may be the caller). Delayed
  /// items do not count until they are due.
  std::size_t outstanding() const;
  /// Ends all waits for signals; later waits end at once.
  void beginEnding();
  /// Waits until no item is queued or running on any queue but the main one, then joins the threads. False
  /// when that takes more than `limitSeconds`; then everything goes on as before.
  bool drain(double limitSeconds);

 private:
  class MainQueue;
  class RepeatingTimer;

  EventLoop& main_;
  const std::shared_ptr<WorkPool> pool_;
  const WorkQueueRef mainQueue_;
  const WorkQueueRef concurrentQueue_;
  const WorkQueueRef backgroundQueue_;
};

}  // namespace kvr
