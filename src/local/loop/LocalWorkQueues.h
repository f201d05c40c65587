#pragma once

#include "local/loop/EventLoop.h"
#include "local/loop/WorkPool.h"
#include "platform/log/Log.h"
#include "platform/services/WorkQueues.h"

#include <cstddef>
#include <memory>
#include <string>

namespace kvr {

/// The queues on real threads: the main queue on the main event loop, all others on one pool of threads.
/// Delays are timers of the main event loop. With nothing to do, nothing wakes up.
///
/// At the end: `beginEnding`, leave the loop, `drain`, destroy.
class LocalWorkQueues : public WorkQueues {
 public:
  /// On the loop's thread. Loop and log must outlive this.
  LocalWorkQueues(EventLoop& main, Log& log);
  /// Lets running items finish, joins all threads and releases queued work. On the loop's thread.
  ~LocalWorkQueues() override;
  LocalWorkQueues(const LocalWorkQueues&) = delete;
  LocalWorkQueues& operator=(const LocalWorkQueues&) = delete;

  WorkQueueRef mainQueue() override { return mainQueue_; }
  WorkQueueRef newSerialQueue(std::string label) override;
  WorkQueueRef concurrentQueue(Priority priority) override;
  void after(double delay, WorkQueueRef queue, Work work) override;
  std::shared_ptr<Timer> newRepeatingTimer(double interval, WorkQueueRef queue, Work work) override;
  std::shared_ptr<Signal> newSignal() override;

  /// Items queued or running, but for the one that runs on the main thread (which may be the one that asks).
  /// Delayed ones do not count until they are due.
  std::size_t outstanding() const;
  /// Ends all waits, and every later one at once.
  void beginEnding();
  /// Waits until no item of any queue but the main one is queued or running, and joins the threads then:
  /// true. False when `limitSeconds` was too short; everything goes on as it was.
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
