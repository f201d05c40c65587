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

/// How a life went.
struct Outcome {
  std::optional<Breach> breach;
  double at = 0;                           ///< seconds since birth, of the breach
  std::optional<std::size_t> afterEvents;  ///< how many of the events had happened then
  std::vector<std::string> lastLines;
  Figures figures;
  std::uint64_t digest = 0;  ///< of what the agent did; the same for the same life
};

/// A device from its first start on, the agent on it, and what happens to both.
class Life {
 public:
  struct Options {
    double years = 1;
    LogLevel leastLogged = LogLevel::Error;
    bool isTraced = false;  ///< what happens is printed
  };

  Life(std::uint64_t seed, Options options);

  Outcome live(const std::vector<Event>& events);

 private:
  void birth();
  void start();
  void end(bool losesPower, bool isStopped, double pause);
  /// Now and then the next process dies while it starts, or soon after.
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
  /// Something calm is over for a while.
  void disturb() {
    disturbed_ = world_.now;
    invariants_.trouble();
  }
  void later(double delay, std::function<void()> work) {
    agenda_.emplace(world_.now + delay, std::move(work));
  }
  SimulatedPlatform* platform() { return process_ ? &process_->simulated : nullptr; }

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
  std::unique_ptr<SimulatedFiles> files_;  ///< while no process is
  SimulatedClock idleClock_;
  double startsAt_ = 0;  ///< the next process, while there is none
  double processBegan_ = 0;
  double clockOffset_ = 0;  ///< of the wall clock
  double disturbed_ = 0;
  double nextLook_ = 0;                     ///< whether all is in order
  bool losesPower_ = false;                 ///< when the crash under way comes
  std::optional<std::size_t> stepsToLive_;  ///< changes of files, for the next process
  bool losesPowerNext_ = false;             ///< when it dies after them
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
