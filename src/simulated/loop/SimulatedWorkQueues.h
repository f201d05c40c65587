#pragma once

#include "platform/services/WorkQueues.h"
#include "simulated/loop/Fiber.h"
#include "simulated/loop/SimulatedClock.h"

#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <random>
#include <string>
#include <utility>
#include <vector>

namespace kvr {

/// Runs all work on one thread, in virtual time, in an order that the seed decides.
///
/// Nothing runs until the test calls `run`, `advance` or `runUntil`. When several items could run next, the
/// seed picks one: the same seed gives the same order; each order is one that real threads could produce as
/// well. An item that waits for a signal or a turn is suspended while others run; its serial queue stays busy
/// meanwhile. The seed also suspends items where a thread could be pre-empted to effect (`mayPause`): where
/// they take or end a turn, hand over work, signal, or change a file. Time passes only when nothing can run.
///
///     queues.mainQueue()->async([&] { ... });
///     queues.run();                                // everything that can run without time passing
///     queues.advance(60);                          // a minute
///     EXPECT_TRUE(queues.runUntil([&] { return replied; }));  // however long it takes
///
/// Faults (see `faults`) are an exception that leaves an item, a wait on the main queue, and a wait that
/// nothing can end any more: its fault says who waits for whom. Use it on one thread only.
class SimulatedWorkQueues : public WorkQueues {
 public:
  /// How many calls of `mayPause` lie between two pauses, on average.
  static constexpr std::uint64_t kPauseEvery = 8;

  SimulatedWorkQueues(SimulatedClock& clock, std::uint64_t seed);
  ~SimulatedWorkQueues() override;
  SimulatedWorkQueues(const SimulatedWorkQueues&) = delete;
  SimulatedWorkQueues& operator=(const SimulatedWorkQueues&) = delete;

  WorkQueueRef mainQueue() override;
  WorkQueueRef newSerialQueue(std::string label) override;
  WorkQueueRef concurrentQueue(Priority priority) override;
  void after(double delay, WorkQueueRef queue, Work work) override;
  std::shared_ptr<Timer> newRepeatingTimer(double interval, WorkQueueRef queue, Work work) override;
  std::shared_ptr<Signal> newSignal() override;
  std::shared_ptr<Turns> newTurns(std::string label) override;

  /// Lets others run now, if this is called inside an item, others can run, and the seed says so.
  void mayPause() {
    if (current_ != nullptr && --pointsToPause_ == 0) pause();
  }
  /// Number of pauses so far.
  std::size_t pauses() const { return pauses_; }

  // For tests; not from inside an item. All of them throw std::logic_error when work adds more work without
  // end while no time passes.

  /// Runs until nothing can run now. No time passes.
  void run();
  /// Lets `seconds` pass and runs everything that becomes due, in order of time.
  void advance(double seconds);
  /// Lets `seconds` pass in which nothing runs, as while a device is suspended; what became due meanwhile is
  /// due immediately afterwards.
  void suspend(double seconds) { clock_.elapsed_ += seconds; }
  /// Advances from event to event until `predicate` holds (true) or nothing is left to happen (false). In the
  /// latter case, waits without a limit cannot end any more: they throw std::logic_error inside their items.
  bool runUntil(const std::function<bool()>& predicate);
  /// From now on every wait returns false at once, including those under way.
  void beginEnding();
  /// Ends every wait, lets the waiting items finish, drops all work that has not run and accepts no more. The
  /// destructor calls it too.
  void end();

  /// Items waiting inside `Signal::wait`.
  std::size_t waiting() const { return waiters_.size(); }
  /// Whether anything can run now or later.
  bool hasFuture() const;

  const std::vector<std::string>& faults() const { return faults_; }
  /// Returns the faults so far and clears them: for tests that provoke one.
  std::vector<std::string> takeFaults() { return std::exchange(faults_, {}); }

 private:
  class Queue;
  class SimulatedTimer;
  class SimulatedSignal;
  class SimulatedTurns;
  struct Runner;
  struct Waiter;
  using EventKey = std::pair<double, std::uint64_t>;  ///< virtual time when due, then order of scheduling

  EventKey schedule(double delay, std::function<void()> event);
  void cancel(const EventKey& key) { events_.erase(key); }
  /// Advances time to the next event, if it is due by `limit`, and runs the event.
  bool step(double limit);

  void enqueue(const std::shared_ptr<Queue>& queue, Work work);
  bool runOne();
  bool runPart();
  void start(std::shared_ptr<Queue> queue, Work work);
  void resume(Runner& runner);
  void work(Runner& runner);
  void finish(Runner& runner);

  bool wait(SimulatedSignal& signal, std::optional<double> limit);
  bool waitInItem(SimulatedSignal& signal, std::optional<double> limit);
  bool waitOutside(const SimulatedSignal& signal, std::optional<double> limit);
  enum class Outcome { Signalled, Over, Deadlocked };
  void wake(const std::shared_ptr<Waiter>& waiter, Outcome outcome);
  void wakeDeadlocked();
  void pause();
  void drawPointsToPause();

  void take(SimulatedTurns& turns);
  void takeInItem(SimulatedTurns& turns);
  void takeOutside(const SimulatedTurns& turns);
  void endTurn(SimulatedTurns& turns);
  static std::string describeRunner(const Runner* runner);
  std::string describeWaits() const;
  void requireOutside() const;

  SimulatedClock& clock_;
  std::mt19937_64 random_;
  std::uint64_t scheduled_ = 0;
  std::map<EventKey, std::function<void()>> events_;

  // What can run now.
  std::vector<std::shared_ptr<Queue>> readyQueues_;  ///< serial queues that are not busy and have an item
  std::vector<Work> readyItems_;                     ///< of the concurrent queues
  std::vector<Runner*> readyRunners_;                ///< items whose wait has ended

  std::vector<std::unique_ptr<Runner>> runners_;
  std::vector<Runner*> idleRunners_;
  Runner* current_ = nullptr;
  std::uint64_t itemsStarted_ = 0;
  std::vector<std::shared_ptr<Waiter>> waiters_;

  std::uint64_t pointsToPause_ = 0;
  bool pausedLast_ = false;  ///< the runner that was resumed last has paused
  std::size_t pauses_ = 0;

  std::vector<std::string> faults_;
  std::string deadlock_;  ///< who waited for whom when nothing could end the waits any more
  bool ending_ = false;
  bool ended_ = false;  ///< no more pauses
  bool closed_ = false;
  std::shared_ptr<Queue> mainQueue_;
  std::shared_ptr<Queue> concurrentQueues_[2];
};

}  // namespace kvr
