#pragma once

#include "kvr-simulate/Invariants.h"
#include "simulated/SimulatedServiceListeners.h"

#include <memory>
#include <set>
#include <string>
#include <vector>

namespace kvr::simulate {

/// The programs that ask the agent, and what they are promised: one answer each, in time, and a right one.
class Clients {
 public:
  Clients(World& world, Invariants& invariants) : world_(world), invariants_(invariants) {}

  /// Some client asks something; what it was, for a trace.
  std::string ask(Dice& dice, SimulatedPlatform& platform);
  std::shared_ptr<const SimulatedServiceConnection::Call> invoke(SimulatedPlatform& platform,
                                                                 const std::string& member,
                                                                 Value::Array arguments);
  void checkAnswers();
  /// Whose follow-ups somebody has asked to dismiss and not been answered.
  std::set<std::string> serialNumbersToDismiss() const;
  /// Whether nobody waits for an answer.
  bool areServed() const { return open_.empty(); }
  /// Nobody was served for so long, and nobody could have been.
  void excuse(double seconds);
  /// The agent has ended, and so have all connections.
  void processEnded();

 private:
  struct OpenCall {
    std::string member;
    Value::Array arguments;
    std::shared_ptr<const SimulatedServiceConnection::Call> call;
    double made;
    double limit;
  };

  void checkAnswer(const OpenCall& call);
  void checkInfo(const OpenCall& call, const Value& info, const std::string& serialNumber,
                 std::uint64_t policy);
  std::shared_ptr<SimulatedServiceConnection> connection(Dice& dice, SimulatedPlatform& platform);
  Value::Array argumentsFor(const std::string& member, Dice& dice) const;

  World& world_;
  Invariants& invariants_;
  std::vector<std::shared_ptr<SimulatedServiceConnection>> connections_;
  std::vector<OpenCall> open_;
};

}  // namespace kvr::simulate
