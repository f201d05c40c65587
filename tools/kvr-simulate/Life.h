#pragma once

#include "kvr-simulate/Clients.h"
#include "kvr-simulate/Events.h"
#include "kvr-simulate/Process.h"

#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace kvr::simulate {

/// The outcome of a life.
struct Outcome {
  std::optional<Breach> breach;
  double at = 0;                           ///< when the breach happened, in seconds since birth
  std::optional<std::size_t> afterEvents;  ///< how many events had happened by then
  std::vector<std::string> lastLines;
  Figures figures;
  std::uint64_t digest = 0;  ///< of the agent's actions; equal for equal lives
};

/// A device from its first start on, with the agent on it and everything that happens to both.
class Life {
 public:
  struct Options {
    double years = 1;
    LogLevel leastLogged = LogLevel::Error;
    bool isTraced = false;  ///< print what happens
  };

  Life(std::uint64_t seed, Options options);

  Outcome live(const std::vector<Event>& events);

 private:
  void birth();
  void start();
  void end(bool losesPower, bool isStopped, double pause);
  /// Sometimes schedules that the next process dies while it starts, or soon after.
  void foretellDeath(Dice& dice);
  void advanceTo(double time);
  void runUntil(double time);
  bool noticeDeath();
  void look();
  bool isOver(double time);
  void rest();
  bool isBroken() const { return invariants_.breach().has_value(); }

  void apply(const Event& event);
  void say(const std::string& text) const;
  /// Marks the end of a calm period.
  void disturb() {
    disturbed_ = world_.now;
    invariants_.trouble();
  }
  void later(double delay, std::function<void()> work) {
    agenda_.emplace(world_.now + delay, std::move(work));
  }
  SimulatedPlatform* platform() { return process_ ? &process_->simulated : nullptr; }

  void call(Dice& dice);
  void offer(Dice& dice);
  void watch(Dice& dice);
  void account(Dice& dice);
  void token(Dice& dice);
  void language(Dice& dice);
  void clock(Dice& dice);
  void suspend(Dice& dice);
  void network(Dice& dice);
  void crash(Dice& dice, bool losesPower);
  void serviceFault(Dice& dice);
  void fileFault(Dice& dice);
  void attestation(Dice& dice);
  void damage(Dice& dice);
  void setting(Dice& dice);
  void setClock(double offset);
  void endFaults();

  const Options options_;
  World world_;
  Invariants invariants_;
  Clients clients_;
  std::unique_ptr<Process> process_;
  std::unique_ptr<SimulatedFiles> files_;  ///< while no process exists
  SimulatedClock idleClock_;
  double startsAt_ = 0;  ///< when the next process starts, while there is none
  double processBegan_ = 0;
  double clockOffset_ = 0;  ///< of the wall clock, in seconds
  double disturbed_ = 0;
  double nextLook_ = 0;                     ///< when to check the invariants next
  bool losesPower_ = false;                 ///< when the process dies in the crash under way
  std::optional<std::size_t> stepsToLive_;  ///< how many steps of file changes the next process lives for
  bool losesPowerNext_ = false;             ///< when the next process dies after them
  std::uint64_t starts_ = 0;
  SimulatedFiles::StepFault stepFault_;
  std::multimap<double, std::function<void()>> agenda_;
  double lastMoment_ = 0;
  std::size_t itemsAtMoment_ = 0;
  std::optional<double> exitAsked_;
  std::uint64_t digest_ = 0;
  std::vector<std::string> lastLines_;
};

}  // namespace kvr::simulate
