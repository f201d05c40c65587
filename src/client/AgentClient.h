#pragma once

#if __cplusplus < 202002L
#error "The kvragent client library needs C++20: compile with -std=c++20 or later."
#endif

#include "client/Records.h"
#include "platform/value/Error.h"

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

struct sd_bus;

namespace kvr::client {

/// When a look-up uses the cache and when it downloads.
enum class Policy : std::uint64_t {
  Default = 0,    ///< the cache if it is good enough, else a download
  CacheOnly = 1,  ///< never a download
  Refresh = 2,    ///< always a download
};

/// The domain and the codes of a client's errors.
inline constexpr std::string_view kErrorDomain = "kvragent.client";
enum Failure : std::int64_t {
  NoBus = 1,             ///< there is no session bus
  AgentUnreachable = 2,  ///< no agent is running, or it ended before it answered
  Refused = 3,           ///< the agent refuses this program; the message names the missing entitlement
  OtherFailure = 4,      ///< anything else; see the message
  NoAnswer = 5,          ///< the agent did not answer within the time that the call gives it
  Cancelled = 6,         ///< the call was cancelled, or its connection destroyed (`AgentConnection`)
};

/// A connection to the agent whose calls wait; `AgentConnection` is one for programs with a loop. Use it on
/// one thread, one call at a time:
///
///     Result<AgentClient> agent = AgentClient::connect();
///     if (agent) { auto info = agent->defaultDeviceInfo(Policy::Default); … }
///
/// A call blocks until it is answered, which can take as long as a download with all its retries. The bus
/// starts an agent that is not running. Errors are in domain `kErrorDomain`; no operation throws, except when
/// memory runs out.
///
/// A warranty's dictionary has the service's own keys; `Coverage::from` reads the usual ones.
class AgentClient {
 public:
  struct Argument {
    const char* type;  ///< "s", "d", "t", "b", "a{sv}" or "aa{sv}"
    Value value;
  };

  static Result<AgentClient> connect();

  Result<Device> defaultDevice() const;
  Result<std::vector<Device>> pairedDevices() const;
  Result<DeviceInfo> defaultDeviceInfo(Policy policy) const;
  /// The text must be UTF-8 without NUL.
  Result<DeviceInfo> deviceInfo(const std::string& serialNumber, Policy policy) const;
  Result<std::vector<DeviceInfo>> allDeviceInfos(Policy policy, bool updateFollowUps) const;
  Result<bool> dismissFollowUp(const std::string& serialNumber) const;
  /// `delay` in seconds.
  Result<bool> scheduleOutreach(double delay) const;
  /// Answered when the agent has dealt with the new account, which may take an hour.
  Result<bool> accountAdded() const;
  /// How the application stands on this device; the keys are the agent's.
  Result<Value> supportApplication(const std::string& bundleIdentifier) const;
  /// Nothing when no override is set.
  Result<std::optional<std::string>> webURLOverride() const;

  /// How long to wait for an answer, in seconds; one day by default.
  void setPatience(int seconds) { patience_ = seconds; }
  /// Called about once a second while a call waits, with the number of seconds so far.
  void setWaiting(std::function<void(int seconds)> waiting) { waiting_ = std::move(waiting); }

  /// Whether an agent is running. Does not start one.
  bool isAgentRunning() const;
  /// Calls a method without arguments and does not wait for the reply.
  std::optional<Error> tell(const char* member) const;
  /// Posts a notification to everyone on the bus.
  std::optional<Error> post(const std::string& notification) const;
  /// Calls any method, by its member name and the type of its reply.
  Result<Value> call(const char* member, const std::vector<Argument>& arguments, const char* replyType) const;

 private:
  struct Close {
    void operator()(sd_bus* bus) const;
  };
  explicit AgentClient(sd_bus* bus) : bus_(bus) {}

  std::unique_ptr<sd_bus, Close> bus_;
  std::function<void(int)> waiting_;
  int patience_ = 24 * 3600;
};

}  // namespace kvr::client
