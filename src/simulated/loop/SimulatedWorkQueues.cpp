#include "simulated/loop/SimulatedWorkQueues.h"

#include "simulated/loop/SimulatedWorkParts.h"

#include <algorithm>
#include <exception>
#include <limits>
#include <optional>
#include <stdexcept>

namespace kvr {

namespace {

constexpr double kShortestInterval = 0.001;
constexpr int kMostItemsAtOnce = 300'000;
constexpr int kMostEvents = 20'000'000;

template <class T>
T takeAt(std::vector<T>& list, std::size_t index) {
  T taken = std::move(list[index]);
  if (index + 1 != list.size()) list[index] = std::move(list.back());
  list.pop_back();
  return taken;
}

}  // namespace

class SimulatedWorkQueues::SimulatedTimer : public Timer {
 public:
  SimulatedTimer(SimulatedWorkQueues& queues, double interval, WorkQueueRef queue, Work work)
      : queues_(queues),
        interval_(std::max(cleanDelay(interval), kShortestInterval)),
        queue_(std::move(queue)),
        firing_(std::make_shared<Firing>(Firing{std::move(work)})) {
    scheduleNext();
  }
  ~SimulatedTimer() override { end(); }
  SimulatedTimer(const SimulatedTimer&) = delete;
  SimulatedTimer& operator=(const SimulatedTimer&) = delete;

  void invalidate() override { end(); }

 private:
  struct Firing {
    Work work;
    bool waits = false;  ///< handed to the queue and not begun
  };

  void end() {
    if (!firing_) return;
    queues_.cancel(next_);
    queue_ = nullptr;
    firing_ = nullptr;
  }

  void scheduleNext() {
    next_ = queues_.schedule(interval_, [this] {
      scheduleNext();
      if (std::exchange(firing_->waits, true)) return;
      queue_->async([firing = firing_] {
        firing->waits = false;
        firing->work();
      });
    });
  }

  SimulatedWorkQueues& queues_;
  const double interval_;
  WorkQueueRef queue_;
  std::shared_ptr<Firing> firing_;
  EventKey next_;
};

SimulatedWorkQueues::SimulatedWorkQueues(SimulatedClock& clock, std::uint64_t seed)
    : clock_(clock),
      random_(seed),
      mainQueue_(std::make_shared<Queue>(*this, true, "main")),
      concurrentQueues_{std::make_shared<Queue>(*this, false, "default"),
                        std::make_shared<Queue>(*this, false, "background")} {
  drawPointsToPause();
}

SimulatedWorkQueues::~SimulatedWorkQueues() {
  end();
  for (const auto& runner : runners_) {
    runner->isStopping = true;
    runner->fiber.resume();
  }
}

WorkQueueRef SimulatedWorkQueues::mainQueue() { return mainQueue_; }

WorkQueueRef SimulatedWorkQueues::newSerialQueue(std::string label) {
  return std::make_shared<Queue>(*this, true, std::move(label));
}

WorkQueueRef SimulatedWorkQueues::concurrentQueue(Priority priority) {
  return concurrentQueues_[priority == Priority::Default ? 0 : 1];
}

void SimulatedWorkQueues::after(double delay, WorkQueueRef queue, Work work) {
  schedule(delay,
           [queue = std::move(queue), work = std::move(work)]() mutable { queue->async(std::move(work)); });
}

std::shared_ptr<Timer> SimulatedWorkQueues::newRepeatingTimer(double interval, WorkQueueRef queue,
                                                              Work work) {
  return std::make_shared<SimulatedTimer>(*this, interval, std::move(queue), std::move(work));
}

std::shared_ptr<Signal> SimulatedWorkQueues::newSignal() { return std::make_shared<SimulatedSignal>(*this); }

std::shared_ptr<Turns> SimulatedWorkQueues::newTurns(std::string label) {
  return std::make_shared<SimulatedTurns>(*this, std::move(label));
}

// Time.

SimulatedWorkQueues::EventKey SimulatedWorkQueues::schedule(double delay, std::function<void()> event) {
  const EventKey key{clock_.elapsed_ + cleanDelay(delay), scheduled_++};
  if (!closed_) events_.emplace(key, std::move(event));
  return key;
}

bool SimulatedWorkQueues::step(double limit) {
  if (events_.empty()) return false;
  const auto first = events_.begin();
  const double due = first->first.first;
  if (due > limit || due == kNever) return false;
  clock_.elapsed_ = std::max(clock_.elapsed_, due);
  const auto event = events_.extract(first);
  event.mapped()();
  return true;
}

bool SimulatedWorkQueues::hasFuture() const {
  return !readyQueues_.empty() || !readyItems_.empty() || !readyRunners_.empty() ||
         (!events_.empty() && events_.begin()->first.first != kNever);
}

void SimulatedWorkQueues::run() {
  requireOutside();
  for (int count = 0;; ++count) {
    if (count == kMostItemsAtOnce) throw std::logic_error("work is handed over without end");
    // Everything due now may be picked next.
    while (step(clock_.elapsed_)) continue;
    if (!runOne()) return;
  }
}

void SimulatedWorkQueues::advance(double seconds) {
  const double target = clock_.elapsed_ + seconds;
  do run();
  while (step(target));
  clock_.elapsed_ = std::max(clock_.elapsed_, target);
}

bool SimulatedWorkQueues::runUntil(const std::function<bool()>& predicate) {
  requireOutside();
  for (int count = 0; !predicate(); ++count) {
    if (count == kMostEvents) throw std::logic_error("events go on without end");
    while (step(clock_.elapsed_)) continue;
    if (runOne() || step(kNever)) continue;
    wakeDeadlocked();
    if (readyRunners_.empty()) return false;
  }
  return true;
}

// Work.

void SimulatedWorkQueues::enqueue(const std::shared_ptr<Queue>& queue, Work work) {
  if (closed_) return;
  if (!queue->isSerial) {
    readyItems_.push_back(std::move(work));
    return;
  }
  queue->items.push_back(std::move(work));
  if (!queue->isBusy && queue->items.size() == 1) readyQueues_.push_back(queue);
}

/// Runs until an item ends or waits.
bool SimulatedWorkQueues::runOne() {
  do {
    pausedLast_ = false;
    if (!runPart()) return false;
  } while (pausedLast_);
  return true;
}

/// Runs one item until it ends, waits or pauses.
bool SimulatedWorkQueues::runPart() {
  const auto heldBack = std::stable_partition(readyRunners_.begin(), readyRunners_.end(),
                                              [](const Runner* runner) { return !runner->isHeldBack; });
  auto runners = static_cast<std::size_t>(heldBack - readyRunners_.begin());
  if (readyQueues_.empty() && readyItems_.empty() && runners == 0) runners = readyRunners_.size();
  const auto count = readyQueues_.size() + readyItems_.size() + runners;
  if (count == 0) return false;
  auto choice = static_cast<std::size_t>(random_() % count);
  if (choice < runners) {
    auto* const runner = takeAt(readyRunners_, choice);
    runner->isHeldBack = false;
    resume(*runner);
    return true;
  }
  choice -= runners;
  if (choice < readyItems_.size()) {
    start(nullptr, takeAt(readyItems_, choice));
    return true;
  }
  const auto queue = takeAt(readyQueues_, choice - readyItems_.size());
  queue->isBusy = true;
  Work item = std::move(queue->items.front());
  queue->items.pop_front();
  start(queue, std::move(item));
  return true;
}

void SimulatedWorkQueues::start(std::shared_ptr<Queue> queue, Work work) {
  if (idleRunners_.empty()) {
    runners_.push_back(std::make_unique<Runner>(*this));
    idleRunners_.push_back(runners_.back().get());
  }
  Runner& runner = *idleRunners_.back();
  idleRunners_.pop_back();
  runner.queue = std::move(queue);
  runner.item = std::move(work);
  runner.number = ++itemsStarted_;
  runner.isDone = false;
  resume(runner);
}

void SimulatedWorkQueues::resume(Runner& runner) {
  current_ = &runner;
  runner.fiber.resume();
  current_ = nullptr;
  if (runner.isDone) finish(runner);
}

void SimulatedWorkQueues::work(Runner& runner) {
  while (!runner.isStopping) {
    try {
      runner.item();
    } catch (const std::exception& error) {
      faults_.push_back(std::string("work item failed: ") + error.what());
    } catch (...) {
      faults_.emplace_back("work item failed");
    }
    runner.item = nullptr;
    runner.isDone = true;
    runner.fiber.pause();
  }
}

void SimulatedWorkQueues::finish(Runner& runner) {
  idleRunners_.push_back(&runner);
  const auto queue = std::exchange(runner.queue, nullptr);
  if (!queue) return;
  queue->isBusy = false;
  if (!queue->items.empty()) readyQueues_.push_back(queue);
}

void SimulatedWorkQueues::requireOutside() const {
  if (current_ != nullptr) throw std::logic_error("the simulation is driven from inside an item");
}

/// Never 0, which `mayPause` counts down to.
void SimulatedWorkQueues::drawPointsToPause() { pointsToPause_ = 1 + random_() % (2 * kPauseEvery - 1); }

void SimulatedWorkQueues::pause() {
  drawPointsToPause();
  if (ended_ || (readyQueues_.empty() && readyItems_.empty() && readyRunners_.empty())) return;
  ++pauses_;
  pausedLast_ = true;
  current_->isHeldBack = random_() % 2 == 0;
  readyRunners_.push_back(current_);
  current_->fiber.pause();
}

// Ending.

void SimulatedWorkQueues::beginEnding() {
  ending_ = true;
  const auto waiters = waiters_;
  for (const auto& waiter : waiters) wake(waiter, Outcome::Over);
}

void SimulatedWorkQueues::end() {
  requireOutside();
  beginEnding();
  ended_ = true;
  while (!readyRunners_.empty()) resume(*takeAt(readyRunners_, 0));
  closed_ = true;
  const auto queues = std::exchange(readyQueues_, {});
  for (const auto& queue : queues) {
    const auto items = std::exchange(queue->items, {});
  }
  const auto items = std::exchange(readyItems_, {});
  const auto events = std::exchange(events_, {});
}

}  // namespace kvr
