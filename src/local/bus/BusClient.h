#pragma once

#include "local/bus/BusCall.h"
#include "local/bus/BusConnection.h"
#include "local/bus/BusObservers.h"
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

/// Lets connections ask the delegate, which may be removed on another thread at any time; removing it waits
/// for a decision under way.
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
/// Its first call starts the admission. Until that is decided, its calls wait:
///
///   1. the bus is asked to report when the connection leaves, and for its user and process;
///   2. on the listener's queue, a handle on the process is opened, its program is looked up and the delegate
///      is asked. A peer of another user, or one whose identity cannot be established, has no entitlements;
///   3. if the process is still alive and the bus, asked again, still knows the connection, it is admitted.
///
/// The calls of an admitted client go in order to its own serial queue; those that ask to be told of changes
/// are answered at once. The calls of a refused client are
/// answered with an error until it leaves. Everything runs on the bus thread unless noted otherwise.
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
    /// Calls that wait or are being served, of all clients. Any thread.
    std::shared_ptr<std::atomic<std::size_t>> openCalls;
    std::shared_ptr<BusObservers> observers;
    /// Drops a client that has left the bus. On the bus thread.
    std::function<void(const std::string& uniqueName)> forget;
    /// The bytes of the open calls' arguments, of all clients. This and what follows: on the bus thread.
    std::shared_ptr<std::size_t> openBytes = std::make_shared<std::size_t>(0);
    std::shared_ptr<UnreadReplies> unread = nullptr;
  };

  BusClient(std::shared_ptr<const Context> context, std::string uniqueName);

  /// Starts the admission. An error when the bus cannot be asked.
  std::optional<Error> begin(sd_bus* bus);
  /// Takes one call of the service's interface, or of `changesInterface`.
  void receive(sd_bus_message* call);
  /// The client has left: drops its calls and ignores answers from now on.
  void close();
  /// Answers call number `call`; without a value, with an error that says that no answer came.
  void answer(std::uint64_t call, const std::optional<Value>& value);

  // For the delegate: on the listener's queue and only while it decides; `resume` at any time. Only the
  // listener's interface can be exported.
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
  bool observe(const BusCall& call);
  void settle(const BusCall& call);
  void release();

  const std::shared_ptr<const Context> context_;
  const std::string name_;
  State state_ = State::Identifying;
  std::string refusal_;
  std::deque<BusCall> waiting_;
  std::map<std::uint64_t, BusCall> open_;  ///< by number
  std::size_t bytes_ = 0;                  ///< of the arguments in both
  std::uint64_t lastCall_ = 0;
  BusSlotRef watch_;
  BusSlotRef question_;
  bool isDeciding_ = false;
  bool isResumed_ = false;

  // Used on the listener's queue while `isDeciding_`, else on the bus thread.
  std::int32_t process_ = 0;
  std::optional<FileIdentity> executable_;
  std::string distrust_;  ///< why the peer's identity is in doubt; empty if it is not
  mutable std::string missingEntitlement_;
  bool isExported_ = false;
  std::shared_ptr<ServiceObject> object_;
  WorkQueueRef queue_;
};

}  // namespace kvr
