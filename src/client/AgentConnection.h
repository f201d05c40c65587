#pragma once

#if __cplusplus < 202002L
#error "The kvragent client library needs C++20: compile with -std=c++20 or later."
#endif

#include "client/AgentClient.h"
#include "client/Records.h"
#include "platform/value/Error.h"

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace kvr::client {

/// A connection to the agent for programs with a loop of their own, such as those with a window. Nothing
/// waits: a call returns at once, and its answer is given to a completion later, by `dispatch`.
///
///     Result<AgentConnection> agent = AgentConnection::connect();
///     agent->watch([](const Result<Change>& change) { … });
///     agent->defaultDeviceInfo(Policy::Default, [](const Result<DeviceInfo>& info) { … });
///     for (;;) {  // or what the program's own loop has for this; see the examples
///       pollfd one{agent->descriptor(), agent->events(), 0};
///       poll(&one, 1, agent->milliseconds());
///       if (!agent->dispatch()) break;
///     }
///
/// Each completion is called exactly once, whatever happens: with the answer, or with an error when the call
/// cannot be made, is refused, is cancelled, takes longer than its limit, or loses the agent or the bus. It
/// is called by `dispatch`, never by the operation itself, in the order in which the answers came; or by the
/// destructor, for calls that are still open then (`Cancelled`). A completion may do anything with the
/// connection, even destroy it, except that a completion called by the destructor may not use it any more.
///
/// Use it on one thread. Errors are in domain `kErrorDomain`. No operation throws, except when memory runs
/// out; what a completion throws leaves `dispatch`.
class AgentConnection {
 public:
  template <class T>
  using Completion = std::function<void(const Result<T>&)>;
  /// Identifies a call, for `cancel`.
  using Call = std::uint64_t;
  using Limit = std::chrono::milliseconds;
  static constexpr Limit kNoLimit = Limit::max();

  static Result<AgentConnection> connect();
  AgentConnection(AgentConnection&& other) noexcept;
  AgentConnection& operator=(AgentConnection&& other) noexcept;
  ~AgentConnection();

  // For the loop. The three change with each operation and each `dispatch`, so ask again before each wait.

  /// To wait for; -1 once the bus is lost.
  int descriptor() const;
  /// What to wait for on it: POLLIN, POLLOUT or both.
  short events() const;
  /// How long to wait at most before `dispatch`; nothing for ever.
  std::optional<std::chrono::microseconds> timeout() const;
  /// The same in milliseconds, rounded up, as poll takes it: -1 for ever.
  int milliseconds() const;
  /// Sends and receives what is possible without waiting, and calls completions and the handler of changes.
  /// False once the bus is lost and every completion has been called; make a new connection then.
  bool dispatch();

  // The operations of `AgentClient`, each with a completion and a limit. The bus starts an agent that is not
  // running. What the agent has begun for a call goes on when the call is cancelled or has taken too long.

  Call defaultDevice(Completion<Device> completion, Limit limit = kNoLimit);
  Call pairedDevices(Completion<std::vector<Device>> completion, Limit limit = kNoLimit);
  Call defaultDeviceInfo(Policy policy, Completion<DeviceInfo> completion, Limit limit = kNoLimit);
  Call deviceInfo(const std::string& serialNumber, Policy policy, Completion<DeviceInfo> completion,
                  Limit limit = kNoLimit);
  Call allDeviceInfos(Policy policy, bool updateFollowUps, Completion<std::vector<DeviceInfo>> completion,
                      Limit limit = kNoLimit);
  Call dismissFollowUp(const std::string& serialNumber, Completion<bool> completion, Limit limit = kNoLimit);
  Call scheduleOutreach(double delay, Completion<bool> completion, Limit limit = kNoLimit);
  Call accountAdded(Completion<bool> completion, Limit limit = kNoLimit);
  Call supportApplication(const std::string& bundleIdentifier, Completion<Value> completion,
                          Limit limit = kNoLimit);
  /// Any method, by its member name and the type of its reply.
  Call call(const char* member, const std::vector<AgentClient::Argument>& arguments, const char* replyType,
            Completion<Value> completion, Limit limit = kNoLimit);

  /// Gives up an open call: its completion gets `Cancelled` at the next `dispatch`. False if there is no such
  /// call, or its answer has come; then the completion gets, or has got, the answer.
  bool cancel(Call call);

  /// Has the handler called when something changes, until `unwatch`. It replaces an earlier one.
  ///
  /// Starts no agent. When one is running, or comes or comes back, the handler is called with
  /// `Change::isBeginning`; a program that asks for everything then misses nothing. It is called with an
  /// error when the agent does not tell this program (`Refused`), or the bus is lost (`NoBus`).
  void watch(Completion<Change> handler);
  /// The handler is not called any more.
  void unwatch();

 private:
  class State;
  explicit AgentConnection(std::shared_ptr<State> state) : state_(std::move(state)) {}

  std::shared_ptr<State> state_;
};

}  // namespace kvr::client
