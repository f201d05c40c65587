#pragma once

#include "core/agent/KVRAgentProtocol.h"
#include "integration/support/BusFixture.h"

#include <iterator>
#include <sstream>

namespace kvr::testing {

/// The command-line client on a bus where this process plays the agent.
struct Kvrctl : BusFixture {
  struct Outcome {
    int status;
    std::string output;
    std::string errors;
  };

  Kvrctl() {
    entitle(true, kProgram);
    behave([this](const std::string& member, const Array& arguments, const ServiceReply& reply) {
      const std::lock_guard lock(mutex_);
      asked_ = member + describe(Value(arguments));
      if (member != heldMember_) return reply(answers_[member]);
      held_.push_back(reply);
      isHeld_.set_value();
    });
  }

  ChildProcess start(std::vector<std::string> arguments, ChildProcess::Environment environment = {}) {
    arguments.insert(arguments.begin(), kProgram);
    environment.merge(ChildProcess::Environment{{"DBUS_SESSION_BUS_ADDRESS", bus.address()},
                                                {"HOME", home.path()},
                                                {"LC_ALL", "C"},
                                                {"TZ", "UTC"},
                                                {"COLUMNS", ""}});
    return ChildProcess(std::move(arguments), environment);
  }
  static Outcome outcomeOf(ChildProcess& program) {
    const int status = program.wait();
    return {status, program.output(), program.errorOutput()};
  }
  Outcome run(std::vector<std::string> arguments, ChildProcess::Environment environment = {}) {
    auto program = start(std::move(arguments), std::move(environment));
    return outcomeOf(program);
  }

  std::shared_ptr<void> serveAgent() { return serve(agentServiceInterface()); }
  /// Sets the agent's reply to a method.
  void setAnswer(const std::string& member, const Value& value) {
    const std::lock_guard lock(mutex_);
    answers_[member] = value;
  }
  /// From now on calls of this method get no reply; the future is ready once one has arrived.
  std::future<void> hold(const std::string& member) {
    const std::lock_guard lock(mutex_);
    heldMember_ = member;
    return isHeld_.get_future();
  }
  /// The last call with its arguments.
  std::string asked() const {
    const std::lock_guard lock(mutex_);
    return asked_;
  }

  static constexpr const char* kProgram = KVR_PROGRAMS "/kvrctl";
  const TemporaryDirectory home;

 private:
  mutable std::mutex mutex_;
  std::map<std::string, Value> answers_;
  std::string asked_;
  std::string heldMember_;
  std::promise<void> isHeld_;
  std::vector<ServiceReply> held_;
};

inline std::vector<std::string> wordsOf(const std::string& line) {
  std::istringstream words(line);
  return {std::istream_iterator<std::string>(words), {}};
}

}  // namespace kvr::testing
