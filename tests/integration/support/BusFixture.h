#pragma once

#include "Prelude.h"
#include "integration/support/PrivateBus.h"
#include "integration/support/RawBusClient.h"
#include "integration/support/RecordingLog.h"
#include "integration/support/TemporaryDirectory.h"
#include "platform/local/EventLoop.h"
#include "platform/local/LocalClock.h"
#include "platform/local/LocalFiles.h"
#include "platform/local/LocalServiceListeners.h"
#include "platform/local/LocalWorkQueues.h"

#include <future>
#include <memory>
#include <mutex>

namespace kvr::testing {

/// A service on a bus of its own, in this process, that does what a test tells it; its clients, too, are this
/// program.
class BusFixture : public ::testing::Test, public ServiceListenerDelegate {
 protected:
  static constexpr std::string_view kEntitlement = "com.example.entitlement";
  /// Long enough for the slowest machine under a sanitizer; only ever spent on a failure.
  static constexpr std::chrono::seconds kLimit{60};

  using Behaviour =
      std::function<void(const std::string& member, const Array& arguments, ServiceReply reply)>;

  BusFixture();
  ~BusFixture() override;

  /// States the entitlement's value for a program, by default this one, and for no other.
  void entitle(const Value& value, const std::string& program = "/proc/self/exe");
  /// Serves the name on the bus until what is returned goes, by default with operations that echo every type.
  /// The name is there on return; after the end nothing of the test is touched any more.
  [[nodiscard]] std::shared_ptr<void> serve(const ServiceInterface& interface = echoInterface());
  void stop();
  RawBusClient newClient() const { return RawBusClient(bus.address()); }
  bool waitUntilLost() { return lost_.get_future().wait_for(kLimit) == std::future_status::ready; }

  static const ServiceInterface& echoInterface();
  bool shouldAcceptNewConnection(ServiceConnection& connection) override;

  PrivateBus bus;
  RecordingLog log;
  /// What objects made from now on do. By default they reply what they were given.
  std::function<Behaviour()> newBehaviour;
  std::function<void()> onObjectGone = [] {};
  std::vector<Value> decisions;  ///< the entitlement's value, at every decision

  std::unique_ptr<LocalServiceListeners> listeners;
  std::unique_ptr<ServiceListener> listener;

 private:
  class Object;

  TemporaryDirectory root_;
  LocalClock clock_;
  LocalFiles files_{log, root_.path()};
  PropertyListFiles lists_{files_, clock_, log};
  DeviceRoot deviceRoot_{lists_, log, root_.path()};
  LocalEntitlements entitlements_{deviceRoot_};
  EventLoop loop_;
  LocalWorkQueues queues_{loop_, log};
  std::promise<void> lost_;
  ServiceInterface interface_{};
};

}  // namespace kvr::testing
