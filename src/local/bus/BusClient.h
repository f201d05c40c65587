#pragma once

#include "local/bus/BusCall.h"
#include "local/bus/BusConnection.h"
#include "local/bus/UnreadReplies.h"
#include "local/buscodec/BusHandles.h"
#include "local/device/LocalEntitlements.h"
#include "platform/log/Log.h"
#include "platform/services/ServiceListener.h"
#include "platform/services/WorkQueues.h"

#include <atomic>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

namespace kvr {

/// Stands between the connections and the delegate, which may go while one is being decided.
class DelegateGate {
 public:
  void set(ServiceListenerDelegate* delegate) {
    const std::lock_guard lock(mutex_);
    delegate_ = delegate;
  }
  /// Whether the delegate accepts the connection; false without a delegate.
  bool accepts(ServiceConnection& connection) {
    const std::lock_guard lock(mutex_);
    return delegate_ && delegate_->shouldAcceptNewConnection(connection);
  }

 private:
  std::mutex mutex_;
  ServiceListenerDelegate* delegate_ = nullptr;
};

/// One connection to the bus that has called the service.
///
/// Its first call starts its admission, and until that is decided its calls wait:
///
///   1. its going is watched, and the bus is asked for its user and process;
///   2. on the listener's queue, the process is held, its program is looked up and the delegate is asked; a
///   peer of another user, or one of whom that cannot be told, holds no entitlement;
///   3. if the process still lives then, and the bus, asked once more, still knows the connection, it is
///   admitted.
///
/// An admitted client's calls are handed in their order to a queue of its own. A refused one's are answered
/// with an error until it goes. Everything runs on the bus thread but what says otherwise.
class BusClient : public ServiceConnection, public std::enable_shared_from_this<BusClient> {
 public:
  /// What all clients of a service share.
  struct Context {
    WorkQueues& queues;
    Log& log;
    const LocalEntitlements& entitlements;
    std::shared_ptr<BusThread> thread;
    WorkQueueRef listenerQueue;
    std::shared_ptr<DelegateGate> delegate;
    ServiceInterface interface;
    /// Calls that wait or are being served. Any thread.
    std::shared_ptr<std::atomic<std::size_t>> openCalls;
    /// Lets go of a client that has left the bus. On the bus thread.
    std::function<void(const std::string& uniqueName)> forget;
    /// The bytes of the open calls' arguments. On the bus thread, as is what follows.
    std::shared_ptr<std::size_t> openBytes = std::make_shared<std::size_t>(0);
    std::shared_ptr<UnreadReplies> unread = nullptr;
  };

  BusClient(std::shared_ptr<const Context> context, std::string uniqueName);

  /// Starts the admission; an error when the bus is not there to be asked.
  std::optional<Error> begin(sd_bus* bus);
  /// Takes one call of the service's interface.
  void receive(sd_bus_message* call);
  /// The client has gone: nothing of it is kept, and what is answered from now on is dropped.
  void close();
  /// The answer to call number `call`, or nothing when there will be none.
  void answer(std::uint64_t call, const std::optional<Value>& value);

  // For the delegate, on the listener's queue and only while it decides, `resume` at any time. The one
  // interface that can be exported is the listener's.
  Value valueForEntitlement(std::string_view entitlement) const override;
  std::int32_t processIdentifier() const override { return process_; }
  void setExportedInterface(const ServiceInterface& interface) override;
  void setExportedObject(std::shared_ptr<ServiceObject> object) override;
  void resume() override;

 private:
  enum class State { Identifying, Admitted, Refused, Gone };
  static int handleWatched(sd_bus_message* message, void* userdata, sd_bus_error* error);
  static int handleOwnerChanged(sd_bus_message* message, void* userdata, sd_bus_error* error);
  static int handleCredentials(sd_bus_message* message, void* userdata, sd_bus_error* error);
  static int handleStillThere(sd_bus_message* message, void* userdata, sd_bus_error* error);
  int ask(sd_bus* bus, const char* member, sd_bus_message_handler_t handler);

  void identified(sd_bus_message* reply);
  void decide();
  void decided(bool accepted);
  void confirmed(sd_bus_message* reply);
  void refuse(const std::string& why);
  bool isBusAnswer(sd_bus_message* reply, const char* member, sd_bus_message_handler_t handler);
  void serveWaiting();
  void serve(BusCall call);
  void settle(const BusCall& call);
  void release();

  const std::shared_ptr<const Context> context_;
  const std::string name_;
  State state_ = State::Identifying;
  std::string refusal_;
  std::deque<BusCall> waiting_;
  std::map<std::uint64_t, BusCall> open_;  ///< by number
  std::size_t bytes_ = 0;                  ///< of both
  std::uint64_t lastCall_ = 0;
  BusSlotRef watch_;
  BusSlotRef question_;
  bool isDeciding_ = false;
  bool isResumed_ = false;

  // While `isDeciding_`, the listener queue's; else the bus thread's.
  std::int32_t process_ = 0;
  std::optional<FileIdentity> executable_;
  std::string distrust_;  ///< why the peer is not known for certain
  mutable std::string missingEntitlement_;
  bool isExported_ = false;
  std::shared_ptr<ServiceObject> object_;
  WorkQueueRef queue_;
};

}  // namespace kvr
