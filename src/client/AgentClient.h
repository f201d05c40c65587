#pragma once

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

/// How a warranty is looked up.
enum class Policy : std::uint64_t {
  Default = 0,    ///< the cache where it is good enough, else a download
  CacheOnly = 1,  ///< never a download
  Refresh = 2,    ///< always a download
};

/// Who speaks in a client's errors, and what their codes mean.
inline constexpr std::string_view kErrorDomain = "kvragent.client";
enum Failure : std::int64_t {
  NoBus = 1,             ///< there is no session bus to speak through
  AgentUnreachable = 2,  ///< no agent is there, or it went away before it had answered
  Refused = 3,           ///< the agent does not serve this program; the message says what it is missing
  OtherFailure = 4,      ///< anything else, in the message's words
};

/// A connection to the agent. One call after the other, on one thread:
///
///     Result<AgentClient> agent = AgentClient::connect();
///     if (agent) { auto info = agent->defaultDeviceInfo(Policy::Default); … }
///
/// A call waits for its answer, which may take as long as a download with all its retries does. An agent that
/// is not running is started by the bus. Errors are in domain `kErrorDomain`; no exception but that of memory
/// running out leaves an operation.
///
/// Of the records, a warranty's dictionary has the service's own keys; `Coverage::from` reads the usual ones.
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
  /// Answered only when the agent has looked into it, which may be an hour later.
  Result<bool> accountAdded() const;
  /// How an application stands on this device; the keys are the agent's.
  Result<Value> supportApplication(const std::string& bundleIdentifier) const;
  /// Nothing when no override is set.
  Result<std::optional<std::string>> webURLOverride() const;

  /// How long an answer is waited for, in seconds; a day at first.
  void setPatience(int seconds) { patience_ = seconds; }
  /// What is to be done about once a second while an answer is waited for, with the seconds so far.
  void setWaiting(std::function<void(int seconds)> waiting) { waiting_ = std::move(waiting); }

  /// Whether an agent is running now; asking starts none.
  bool isAgentRunning() const;
  /// Calls a member without arguments, and does not wait for its reply.
  std::optional<Error> tell(const char* member) const;
  /// Posts a notification to everyone on the bus.
  std::optional<Error> post(const std::string& notification) const;
  /// Any operation, by its member's name and the type of what it replies.
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
