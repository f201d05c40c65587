// Processes and time.

#include "kvr-simulate/Life.h"

#include <cmath>
#include <cstdio>
#include <exception>

namespace kvr::simulate {
namespace {

constexpr double kHour = 3600;
constexpr double kDay = 24 * kHour;
constexpr double kYear = 365 * kDay;
constexpr double kCalm = 3 * kHour;  ///< after so long without disturbance, everything must be in order
constexpr double kLookInterval = 6 * kHour;
constexpr std::size_t kMostItemsAtOnce = 200'000;

}  // namespace

Life::Life(std::uint64_t seed, Options options)
    : options_(options), world_(seed), invariants_(world_), clients_(world_, invariants_) {}

void Life::say(const std::string& text) const {
  if (!options_.isTraced) return;
  std::printf("%12.1f  %s\n", world_.now, text.c_str());
}

void Life::birth() {
  files_ = std::make_unique<SimulatedFiles>(idleClock_);
  if (world_.dice.happens(0.3)) world_.putLegacyFiles(*files_);
  foretellDeath(world_.dice);
}

void Life::start() {
  process_ = std::make_unique<Process>(world_, invariants_, clients_, world_.seed * 1'000'003 + ++starts_,
                                       options_.leastLogged, files_.get());
  auto& simulated = process_->simulated;
  simulated.clock.set(SimulatedClock::kDefaultStart + world_.now + clockOffset_);
  simulated.files.setStepFault(stepFault_);
  processBegan_ = world_.now;
  exitAsked_.reset();
  disturb();
  say("the agent starts");
  invariants_.beginProcess(simulated);
  if (stepsToLive_) simulated.files.killAfterSteps(*stepsToLive_);
  losesPower_ = stepsToLive_ && losesPowerNext_;
  stepsToLive_.reset();
  try {
    process_->start();
  } catch (const std::exception& error) {
    invariants_.report("no activity spins", error.what());
  }
  noticeDeath();
}

void Life::foretellDeath(Dice& dice) {
  if (!dice.happens(0.2)) return;
  stepsToLive_ = 1 + dice.below(40);
  losesPowerNext_ = dice.happens(0.4);
}

void Life::end(bool losesPower, bool isStopped, double pause) {
  if (!process_) return;
  say(isStopped ? "the agent ends" : losesPower ? "the power is lost" : "the agent dies");
  auto& simulated = process_->simulated;
  if (isStopped) process_->stop(clients_.serialNumbersToDismiss());
  invariants_.endProcess();
  clients_.processEnded();
  auto files = std::make_unique<SimulatedFiles>(idleClock_);
  files->takeOver(simulated.files);
  if (losesPower) {
    files->losePower(world_.dice.random);
    invariants_.powerLost();
  }
  files_ = std::move(files);
  digest_ = digest_ * 31 + invariants_.figures.requests + simulated.files.readCount();
  lastLines_ = simulated.log.texts();
  world_.heldToken = simulated.accounts.tokens.begin()->second;
  process_.reset();
  startsAt_ = world_.now + pause;
  losesPower_ = false;
}

/// Whether to stop running the process; called after every work item.
bool Life::isOver(double time) {
  auto& simulated = process_->simulated;
  world_.now = processBegan_ + simulated.clock.elapsed();
  invariants_.step();
  clients_.checkAnswers();
  if (world_.now != lastMoment_) itemsAtMoment_ = 0;
  lastMoment_ = world_.now;
  if (++itemsAtMoment_ > kMostItemsAtOnce) invariants_.report("no activity spins", "work without end");
  if (isBroken() || simulated.files.isKilled() || world_.now >= time) return true;
  if (!exitAsked_ && !simulated.cleanExit.requests.empty()) exitAsked_ = world_.now;
  return exitAsked_ && world_.now > *exitAsked_ + 6 && clients_.areServed() && process_->isIdle();
}

void Life::runUntil(double time) {
  auto& simulated = process_->simulated;
  auto& queues = simulated.queues;
  queues.after(time - world_.now, queues.mainQueue(), [] {});
  try {
    queues.runUntil([&] { return isOver(time); });
  } catch (const std::exception& error) {
    invariants_.report("no activity spins", error.what());
  }
  if (isBroken()) return;
  if (!noticeDeath() && world_.now < time) end(false, true, 0.2);
}

/// Ends a process that was cut off from its files; false if it was not.
bool Life::noticeDeath() {
  if (!process_ || !process_->simulated.files.isKilled()) return false;
  ++(losesPower_ ? invariants_.figures.powerLosses : invariants_.figures.crashes);
  end(losesPower_, false, world_.dice.oneOf({0.2, 5.0, kHour}));
  return true;
}

void Life::advanceTo(double time) {
  while (!isBroken() && (world_.now < time || (!agenda_.empty() && agenda_.begin()->first <= time))) {
    double stop = std::min(time, nextLook_);
    if (!agenda_.empty()) stop = std::min(stop, agenda_.begin()->first);
    stop = std::max(stop, world_.now);
    if (!agenda_.empty() && agenda_.begin()->first <= world_.now) {
      const auto work = agenda_.extract(agenda_.begin());
      work.mapped()();
    } else if (process_) {
      runUntil(stop);
    } else if (startsAt_ <= stop) {
      world_.now = std::max(world_.now, startsAt_);
      start();
    } else {
      world_.now = stop;
    }
    if (world_.now >= nextLook_) look();
  }
}

/// Checks at fixed times whatever happens, so that a reduced list of events does not hide a breach.
void Life::look() {
  nextLook_ = (std::floor(world_.now / kLookInterval) + 1) * kLookInterval;
  const bool isCalm = process_ && !stepFault_ && world_.now > disturbed_ + kCalm &&
                      world_.service.coverageFault == Service::Fault::None && world_.isNetworkReachable;
  if (!isBroken() && isCalm) invariants_.checkCalm();
}

/// After the faults have stopped: requests an outreach, waits for its effects, and looks up every device.
void Life::rest() {
  endFaults();
  clients_.lieInWaitNoLonger();
  agenda_.clear();
  if (!process_) startsAt_ = std::min(startsAt_, world_.now);
  advanceTo(world_.now + 2 * kDay);
  if (isBroken()) return;
  clients_.invoke(process_->simulated, "ScheduleOutreach", {});
  const Date asked = process_->simulated.clock.now();
  advanceTo(world_.now + 3 * kHour);
  if (isBroken()) return;
  clients_.invoke(process_->simulated, "GetAllDeviceInfosUsingPolicy", {2, true});
  advanceTo(world_.now + kHour);
  if (isBroken()) return;
  invariants_.checkRest(asked);
  disturbed_ = world_.now - 2 * kCalm;
  for (int day = 0; day < 12 && !isBroken(); ++day) advanceTo(world_.now + kDay);
  if (!isBroken() && !clients_.areServed()) invariants_.report("every call is answered", "at the end");
}

Outcome Life::live(const std::vector<Event>& events) {
  Outcome outcome;
  birth();
  std::size_t happened = 0;
  for (const auto& event : events) {
    advanceTo(event.at);
    if (isBroken()) break;
    apply(event);
    noticeDeath();
    ++happened;
  }
  if (!isBroken()) {
    advanceTo(options_.years * kYear);
    if (!isBroken()) rest();
  }
  outcome.at = world_.now;
  outcome.breach = invariants_.breach();
  if (outcome.breach) outcome.afterEvents = happened;
  end(false, false, 0);
  if (!outcome.breach) outcome.breach = invariants_.breach();
  outcome.lastLines = std::move(lastLines_);
  outcome.figures = invariants_.figures;
  outcome.digest = digest_;
  return outcome;
}

}  // namespace kvr::simulate
