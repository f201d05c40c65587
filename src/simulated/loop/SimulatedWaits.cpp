// Waiting for turns and signals.

#include "simulated/loop/SimulatedWorkParts.h"
#include "simulated/loop/SimulatedWorkQueues.h"

#include <algorithm>
#include <stdexcept>

namespace kvr {

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

// Signals.

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

}  // namespace kvr
