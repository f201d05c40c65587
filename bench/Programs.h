#pragma once

#include "integration/support/AgentWorld.h"

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

namespace kvr::bench {

using testing::AgentWorld;

using testing::RawBusClient;

/// A program that runs as long as this object exists; its output goes to /dev/null. It is started as directly
/// as the system allows, so that its start can be measured.
class Program {
 public:
  Program(std::vector<std::string> arguments, std::vector<std::string> environment);
  ~Program();
  Program(const Program&) = delete;
  Program& operator=(const Program&) = delete;
  pid_t pid() const { return pid_; }

 private:
  pid_t pid_ = -1;
};

/// The agent and the bare service on one private bus, with the coverage service behind the agent.
class Programs {
 public:
  static constexpr const char* kBareName = "com.tarsil.kvragent.bare";

  Programs();

  void startAgent();
  /// `tree` is the reply to "Info"; null for an empty one.
  void startBare(const Value& tree = {});
  void stopAgent() { agent_.reset(); }
  void stopBare() { bare_.reset(); }
  pid_t agent() const { return agent_->pid(); }
  pid_t bare() const { return bare_->pid(); }
  /// Lets the agent download the phone's coverage and waits until its files count as settled.
  void fillCache() const;
  /// A new client on the bus of the two.
  RawBusClient newClient() const { return world.newClient(); }

  AgentWorld world{AgentWorld::Attestation::Optional, AgentWorld::Transport::Plain};

 private:
  std::unique_ptr<Program> run(const std::string& program, std::vector<std::string> arguments = {}) const;
  void waitForName(const char* name) const;

  std::unique_ptr<Program> agent_;
  std::unique_ptr<Program> bare_;
};

BusMessageRef infoCall(const RawBusClient& client, std::uint64_t policy = AgentWorld::CacheOnly);
BusMessageRef bareInfoCall(const RawBusClient& client);
BusMessageRef allInfosCall(const RawBusClient& client);
BusMessageRef bareAllInfosCall(const RawBusClient& client);
BusMessageRef pingCall(const RawBusClient& client);
/// Sends the call and waits for the answer; throws its error.
BusMessageRef answerTo(const RawBusClient& client, const BusMessageRef& call);

/// A process's private memory, in KiB.
double privateMemory(pid_t process);
/// The part of it that the process has written to. The rest is code, which other processes may come to share.
double writtenMemory(pid_t process);
/// How many context switches the threads of a process have had.
std::int64_t contextSwitches(pid_t process);

}  // namespace kvr::bench
