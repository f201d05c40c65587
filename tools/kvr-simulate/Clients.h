#pragma once

#include "kvr-simulate/Invariants.h"
#include "simulated/SimulatedServiceListeners.h"

#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace kvr::simulate {

/// The client programs, and what they are promised: exactly one answer to each call, in time, and a correct
/// one.
class Clients {
 public:
  Clients(World& world, Invariants& invariants) : world_(world), invariants_(invariants) {}

  /// Makes a random call, about this device if it is about one; returns a description for a trace.
  std::string ask(Dice& dice, SimulatedPlatform& platform, const std::string& serialNumber);
  std::shared_ptr<const SimulatedServiceConnection::Call> invoke(SimulatedPlatform& platform,
                                                                 const std::string& member,
                                                                 Value::Array arguments);
  /// From now on a client waits for a moment at which the agent is in the middle of its work.
  void lieInWait(Dice& dice);
  void lieInWaitNoLonger();
  /// The agent has just looked at the pending follow-ups: a client dismisses one, if one lies in wait.
  void followUpsSeen(SimulatedPlatform& platform, const std::vector<FollowUpItem>& pending);
  /// The agent is about to register this activity: a client schedules an outreach, if one lies in wait.
  void registering(SimulatedPlatform& platform, const std::string& activity);
  void checkAnswers();
  /// The devices with an unanswered request to dismiss their follow-ups.
  std::set<std::string> serialNumbersToDismiss() const;
  /// Whether no call is unanswered.
  bool areServed() const { return open_.empty(); }
  /// Extends all deadlines by a time in which no call could be served.
  void excuse(double seconds);
  /// The process has ended, and with it all connections.
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
  static Value::Array argumentsFor(const std::string& member, Dice& dice, std::string serialNumber);

  World& world_;
  Invariants& invariants_;
  std::vector<std::shared_ptr<SimulatedServiceConnection>> connections_;
  std::vector<OpenCall> open_;
  std::optional<std::uint64_t> dismissesSeen_;  ///< decides which follow-up
  std::optional<double> schedulesAfter_;        ///< seconds
};

}  // namespace kvr::simulate
