#pragma once

#include "client/AgentConnection.h"
#include "local/buscodec/BusHandles.h"

#include <chrono>
#include <deque>
#include <functional>
#include <map>
#include <string>

namespace kvr::client {

/// What an `AgentConnection` holds. Callbacks of the bus library only record what has come; completions are
/// called from `ready_`, when the bus library is not at work.
class AgentConnection::State {
 public:
  using Clock = std::chrono::steady_clock;

  explicit State(sd_bus* bus);
  State(const State&) = delete;
  State& operator=(const State&) = delete;

  sd_bus* bus() const { return bus_.get(); }
  bool isLost() const { return isLost_; }
  std::optional<std::chrono::microseconds> timeout() const;
  bool dispatch();
  Call call(const char* member, const std::vector<AgentClient::Argument>& arguments, const char* replyType,
            Completion<Value> completion, Limit limit);
  bool cancel(Call call);
  void watch(Completion<Change> handler);
  void unwatch();
  /// Calls every completion that has not been called.
  void close();

 private:
  struct Open {
    State* owner = nullptr;
    Call number = 0;
    const char* replyType = nullptr;
    Completion<Value> completion;
    std::optional<Clock::time_point> end;
    BusSlotRef slot;
  };

  static int handleAnswer(sd_bus_message* message, void* userdata, sd_bus_error* error);
  static int handleOwnerChanged(sd_bus_message* message, void* userdata, sd_bus_error* error);
  static int handleOwner(sd_bus_message* message, void* userdata, sd_bus_error* error);
  static int handleSubscribed(sd_bus_message* message, void* userdata, sd_bus_error* error);
  static int handleAny(sd_bus_message* message, void* userdata, sd_bus_error* error);

  void settle(Call number, Result<Value> answer);
  void receive();
  void expire();
  void lose();
  void askOwner();
  void ask(sd_bus_message* question, sd_bus_message_handler_t handler);
  void setOwner(const std::string& owner);
  void subscribe();
  void take(sd_bus_message* signal);
  void tell(Result<Change> change);

  BusRef bus_;
  bool isLost_ = false;
  bool isClosed_ = false;
  Call lastCall_ = 0;
  std::map<Call, Open> open_;
  std::deque<std::function<void()>> ready_;

  // The watch.
  Completion<Change> handler_;
  std::uint64_t watch_ = 0;  ///< number of the present one
  std::string owner_;        ///< the agent's unique name; empty if none is running, or it is not known yet
  BusSlotRef ownerWatch_;
  BusSlotRef filter_;
  BusSlotRef question_;
};

}  // namespace kvr::client
