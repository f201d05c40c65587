#pragma once

// What the work queues are made of; for their own sources only.

#include "simulated/loop/SimulatedWorkQueues.h"

#include <limits>

namespace kvr {

inline constexpr double kNever = std::numeric_limits<double>::infinity();

/// A delay in seconds as it counts: an undefined or negative one as 0, one that is too long as never.
inline double cleanDelay(double delay) {
  constexpr double kLongestDelay = 1e13;  // seconds
  if (!(delay > 0)) return 0;
  if (delay > kLongestDelay) return kNever;
  return delay;
}

class SimulatedWorkQueues::Queue : public WorkQueue, public std::enable_shared_from_this<Queue> {
 public:
  Queue(SimulatedWorkQueues& theQueues, bool serial, std::string theLabel)
      : queues(theQueues), isSerial(serial), label(std::move(theLabel)) {}
  void async(Work work) override {
    queues.enqueue(shared_from_this(), std::move(work));
    queues.mayPause();
  }

  SimulatedWorkQueues& queues;
  const bool isSerial;
  const std::string label;
  bool isBusy = false;
  std::deque<Work> items;  ///< of a serial queue
};

/// Runs items one after the other on its own stack.
struct SimulatedWorkQueues::Runner {
  explicit Runner(SimulatedWorkQueues& queues) : fiber([this, &queues] { queues.work(*this); }) {}

  std::shared_ptr<Queue> queue;  ///< null for a concurrent one
  Work item;
  std::uint64_t number = 0;  ///< of the item, in the order in which items start
  const SimulatedTurns* awaited = nullptr;
  bool isHeldBack = false;  ///< paused until nothing else can run
  bool isDone = false;
  bool isStopping = false;
  Fiber fiber;
};

struct SimulatedWorkQueues::Waiter {
  Runner* runner;
  const SimulatedSignal* signal;
  bool hasLimit;
  EventKey timer;
  Outcome outcome;
};

class SimulatedWorkQueues::SimulatedSignal : public Signal {
 public:
  explicit SimulatedSignal(SimulatedWorkQueues& queues) : queues_(queues) {}

  void signal() override {
    if (std::exchange(signalled_, true)) return;
    const auto waiters = queues_.waiters_;
    for (const auto& waiter : waiters) {
      if (waiter->signal == this) queues_.wake(waiter, Outcome::Signalled);
    }
    queues_.mayPause();
  }
  bool wait(std::optional<double> limit) override { return signalled_ || queues_.wait(*this, limit); }
  bool isSignalled() const { return signalled_; }

 private:
  SimulatedWorkQueues& queues_;
  bool signalled_ = false;
};

class SimulatedWorkQueues::SimulatedTurns : public Turns {
 public:
  SimulatedTurns(SimulatedWorkQueues& queues, std::string theLabel)
      : label(std::move(theLabel)), queues_(queues) {}
  void lock() override {
    queues_.mayPause();
    queues_.take(*this);
  }
  void unlock() override {
    if (--depth > 0) return;
    queues_.endTurn(*this);
    queues_.mayPause();
  }
  bool areTakenByAnother(const Runner* runner) const { return depth > 0 && holder != runner; }

  const std::string label;
  int depth = 0;                   ///< how often the holder has locked it
  const Runner* holder = nullptr;  ///< null: code outside of all items, if `depth` is not 0
  std::vector<Runner*> waiting;

 private:
  SimulatedWorkQueues& queues_;
};

}  // namespace kvr
