#pragma once

#include "integration/support/AgentWorld.h"

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

namespace kvr::bench {

using testing::AgentWorld;

using testing::RawBusClient;

/// A program that runs for as long as this lives; what it prints goes to /dev/null. Started as directly as
/// the system allows, so that its start can be measured.
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

/// The real agent and the bare service on one private bus, the coverage service behind the agent.
class Programs {
 public:
  static constexpr const char* kBareName = "com.tarsil.kvragent.bare";

  Programs();

  void startAgent();
  /// `tree` is what its "Info" replies, null for nothing.
  void startBare(const Value& tree = {});
  void stopAgent() { agent_.reset(); }
  void stopBare() { bare_.reset(); }
  pid_t agent() const { return agent_->pid(); }
  pid_t bare() const { return bare_->pid(); }
  /// Has the agent download the coverage of the phone, and waits until its files count as old.
  void fillCache() const;
  /// Lets a client call without a connection of its own being counted.
  RawBusClient newClient() const { return world.newClient(); }

  AgentWorld world{AgentWorld::Attestation::Optional};

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
/// Sends the call and waits; throws what it failed with.
BusMessageRef answerTo(const RawBusClient& client, const BusMessageRef& call);

/// What a process has in memory for itself alone, in KiB.
double privateMemory(pid_t process);
/// What of it the process has written to. The rest is code, which others may share at one time or another.
double writtenMemory(pid_t process);
/// How often the threads of a process have been put on and off a processor.
std::int64_t contextSwitches(pid_t process);

}  // namespace kvr::bench
