#include "simulated/loop/SimulatedWorkQueues.h"

#include <algorithm>
#include <exception>
#include <limits>
#include <optional>
#include <stdexcept>

namespace kvr {

namespace {

constexpr double kNever = std::numeric_limits<double>::infinity();
constexpr double kLongestDelay = 1e13;  // seconds; anything above never comes
constexpr double kShortestInterval = 0.001;
constexpr int kMostItemsAtOnce = 300'000;
constexpr int kMostEvents = 20'000'000;

double cleanDelay(double delay) {
  if (!(delay > 0)) return 0;
  if (delay > kLongestDelay) return kNever;
  return delay;
}

template <class T>
T takeAt(std::vector<T>& list, std::size_t index) {
  T taken = std::move(list[index]);
  if (index + 1 != list.size()) list[index] = std::move(list.back());
  list.pop_back();
  return taken;
}

}  // namespace

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

void SimulatedWorkQueues::pauseEvery(std::uint64_t points) {
  pauseEvery_ = points;
  drawPointsToPause();
}

/// Never 0, which `mayPause` counts down to.
void SimulatedWorkQueues::drawPointsToPause() {
  pointsToPause_ =
      pauseEvery_ == 0 ? std::numeric_limits<std::uint64_t>::max() : 1 + random_() % (2 * pauseEvery_ - 1);
}

void SimulatedWorkQueues::pause() {
  drawPointsToPause();
  if (ended_ || (readyQueues_.empty() && readyItems_.empty() && readyRunners_.empty())) return;
  ++pauses_;
  pausedLast_ = true;
  current_->isHeldBack = random_() % 2 == 0;
  readyRunners_.push_back(current_);
  current_->fiber.pause();
}

// Turns.

void SimulatedWorkQueues::take(SimulatedTurns& turns) {
  while (turns.areTakenByAnother(current_)) {
    current_ == nullptr ? takeOutside(turns) : takeInItem(turns);
  }
  turns.holder = current_;
  ++turns.depth;
}

void SimulatedWorkQueues::takeInItem(SimulatedTurns& turns) {
  Runner& runner = *current_;
  runner.awaited = &turns;
  const auto* holder = turns.holder;
  while (holder != nullptr && holder != &runner && holder->awaited != nullptr)
    holder = holder->awaited->holder;
  if (holder == &runner) {
    const auto waits = describeWaits();
    runner.awaited = nullptr;
    throw std::logic_error("deadlock: " + waits);
  }
  turns.waiting.push_back(&runner);
  runner.fiber.pause();
  runner.awaited = nullptr;
}

/// Runs others until the turn has ended.
void SimulatedWorkQueues::takeOutside(const SimulatedTurns& turns) {
  while (turns.depth > 0) {
    while (step(clock_.elapsed_)) continue;
    if (!runOne() && !step(kNever)) throw std::logic_error("deadlock: " + describeWaits());
  }
}

void SimulatedWorkQueues::endTurn(SimulatedTurns& turns) {
  turns.holder = nullptr;
  const auto waiting = std::exchange(turns.waiting, {});
  readyRunners_.insert(readyRunners_.end(), waiting.begin(), waiting.end());
}

std::string SimulatedWorkQueues::describeRunner(const Runner* runner) {
  if (runner == nullptr) return "code outside of all items";
  return "item " + std::to_string(runner->number) + " of " +
         (runner->queue ? "the queue '" + runner->queue->label + "'" : "a concurrent queue");
}

/// Who waits for whom.
std::string SimulatedWorkQueues::describeWaits() const {
  std::string text;
  for (const auto& runner : runners_) {
    if (runner->awaited == nullptr) continue;
    text += describeRunner(runner.get()) + " waits for the turn '" + runner->awaited->label + "' of " +
            describeRunner(runner->awaited->holder) + "; ";
  }
  for (const auto& waiter : waiters_) {
    if (!waiter->hasLimit) text += describeRunner(waiter->runner) + " waits for a signal; ";
  }
  return text + "nothing can end this wait";
}

// Waiting.

bool SimulatedWorkQueues::wait(SimulatedSignal& signal, std::optional<double> limit) {
  if (limit && cleanDelay(*limit) == kNever) limit.reset();
  return current_ == nullptr ? waitOutside(signal, limit) : waitInItem(signal, limit);
}

bool SimulatedWorkQueues::waitInItem(SimulatedSignal& signal, std::optional<double> limit) {
  if (current_->queue == mainQueue_) throw std::logic_error("an item waits on the main queue");
  if (ending_) return false;
  const auto waiter =
      std::make_shared<Waiter>(Waiter{current_, &signal, limit.has_value(), {}, Outcome::Over});
  waiters_.push_back(waiter);
  if (limit) waiter->timer = schedule(*limit, [this, waiter] { wake(waiter, Outcome::Over); });
  current_->fiber.pause();
  if (waiter->outcome == Outcome::Deadlocked) throw std::logic_error("deadlock: " + deadlock_);
  return waiter->outcome == Outcome::Signalled;
}

bool SimulatedWorkQueues::waitOutside(const SimulatedSignal& signal, std::optional<double> limit) {
  const double deadline = limit ? clock_.elapsed_ + cleanDelay(*limit) : kNever;
  while (!signal.isSignalled() && !ending_) {
    while (step(clock_.elapsed_)) continue;
    if (runOne() || step(deadline)) continue;
    if (!limit) throw std::logic_error("deadlock: " + describeWaits());
    clock_.elapsed_ = std::max(clock_.elapsed_, deadline);
    break;
  }
  return signal.isSignalled();
}

void SimulatedWorkQueues::wake(const std::shared_ptr<Waiter>& waiter, Outcome outcome) {
  waiter->outcome = outcome;
  if (waiter->hasLimit) cancel(waiter->timer);
  std::erase(waiters_, waiter);
  readyRunners_.push_back(waiter->runner);
}

void SimulatedWorkQueues::wakeDeadlocked() {
  deadlock_ = describeWaits();
  const auto waiters = waiters_;
  for (const auto& waiter : waiters) wake(waiter, Outcome::Deadlocked);
}

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
