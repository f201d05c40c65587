#pragma once

#include "platform/services/ServiceListener.h"
#include "platform/services/WorkQueues.h"

#include <map>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace kvr {

/// The program at the client's end of a connection.
struct SimulatedPeer {
  Value::Dictionary entitlements;
  std::int32_t processIdentifier = 1000;
};

/// One client's connection to a service, seen from both ends. The test has the client's end:
///
///     const auto client =
///         simulated.services.connect("com.tarsil.kvragent", {{{"entitlement", true}}, 1234});
///     const auto call = client->invoke("PairedDevices");
///     simulated.queues.run();
///     ASSERT_TRUE(client->isAccepted());
///     EXPECT_EQ(*call->reply, Value::Array{});
class SimulatedServiceConnection : public ServiceConnection,
                                   public std::enable_shared_from_this<SimulatedServiceConnection> {
 public:
  struct Call {
    std::optional<Value> reply;
    bool isRefused = false;  ///< because the connection was refused or is gone
  };

  SimulatedServiceConnection(WorkQueues& queues, Log& log, SimulatedPeer peer);

  // The client's end.

  /// Calls a method by its member name. It is served once the connection is accepted; an unknown member then
  /// throws std::logic_error.
  std::shared_ptr<const Call> invoke(std::string member, Value::Array arguments = {});
  /// The client leaves: later calls are refused, and the exported object is released on the connection's
  /// queue.
  void disconnect();
  /// Whether the delegate has accepted the connection, or refused it; both are false until it decides.
  bool isAccepted() const { return accepted_ == true; }
  bool isRefused() const { return accepted_ == false; }
  const std::optional<ServiceInterface>& exportedInterface() const { return interface_; }
  const std::shared_ptr<ServiceObject>& exportedObject() const { return object_; }

  // The service's end.

  Value valueForEntitlement(std::string_view entitlement) const override;
  std::int32_t processIdentifier() const override { return peer_.processIdentifier; }
  void setExportedInterface(const ServiceInterface& interface) override { interface_ = interface; }
  void setExportedObject(std::shared_ptr<ServiceObject> object) override { object_ = std::move(object); }
  void resume() override { isResumed_ = true; }

 private:
  friend class SimulatedServiceListeners;

  struct Pending {
    std::string member;
    Value::Array arguments;
    std::shared_ptr<Call> call;
  };

  void decide(bool accepted);
  void serve(const Pending& pending);

  Log& log_;
  const WorkQueueRef queue_;
  const SimulatedPeer peer_;
  std::optional<bool> accepted_;
  bool isResumed_ = false;
  bool isGone_ = false;
  std::vector<Pending> pending_;  ///< calls made before the decision
  std::optional<ServiceInterface> interface_;
  std::shared_ptr<ServiceObject> object_;
};

/// The services of one process, with a way to connect simulated clients.
class SimulatedServiceListeners : public ServiceListeners {
 public:
  SimulatedServiceListeners(WorkQueues& queues, Log& log) : queues_(queues), log_(log) {}

  std::unique_ptr<ServiceListener> newListener(std::string name) override;

  /// Connects a client to a service that has been resumed (else throws std::logic_error). The delegate is
  /// asked on the listener's queue.
  std::shared_ptr<SimulatedServiceConnection> connect(const std::string& name, SimulatedPeer peer);
  /// Whether a listener of this name exists and has been resumed.
  bool isListening(const std::string& name) const;

 private:
  class Listener;

  WorkQueues& queues_;
  Log& log_;
  std::map<std::string, Listener*> listeners_;  ///< the resumed ones, by name
};

}  // namespace kvr
