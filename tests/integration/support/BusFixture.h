#pragma once

#include "Prelude.h"
#include "integration/support/PrivateBus.h"
#include "integration/support/RawBusClient.h"
#include "local/bus/LocalServiceListeners.h"
#include "local/loop/EventLoop.h"
#include "local/loop/LocalWorkQueues.h"
#include "local/system/LocalClock.h"
#include "local/system/LocalFiles.h"
#include "simulated/SimulatedLog.h"

#include <stdlib.h>

#include <future>
#include <mutex>

namespace kvr::testing {

/// A service on a private bus, in this process, whose behaviour the test sets. Its clients are in this
/// process too.
struct BusFixture : ::testing::Test, ServiceListenerDelegate {
  static constexpr std::string_view kEntitlement = "com.example.entitlement";
  /// Long enough for the slowest machine under a sanitizer; only a failing test waits this long.
  static constexpr std::chrono::seconds kLimit{60};

  using Behaviour = std::function<void(const std::string& member, const Array&, ServiceReply reply)>;

  BusFixture() {
    ::setenv("DBUS_SESSION_BUS_ADDRESS", bus.address().c_str(), 1);
    entitle(true);
    listeners =
        std::make_unique<LocalServiceListeners>(queues_, log, entitlements_, [this] { lost_.set_value(); });
    listener = listeners->newListener(RawBusClient::kName);
    listener->setDelegate(*this);
  }
  ~BusFixture() override { stop(); }

  /// Grants the entitlement with this value to one program, by default this one, and to no other.
  void entitle(const Value& value, const std::string& program = "/proc/self/exe") {
    const Dictionary granted{{std::string(kEntitlement), value}};
    root_.write("Entitlements.plist",
                *writePropertyList(Dictionary{{std::filesystem::canonical(program).string(), granted}},
                                   PropertyListEncoding::XML));
  }
  /// Serves the name on the bus until the returned object is destroyed, by default with methods that echo
  /// each type. On return the name is owned; after the end nothing of the test is used any more.
  [[nodiscard]] std::shared_ptr<void> serve(const ServiceInterface& interface = echoInterface()) {
    interface_ = interface;
    listener->resume(interface);
    if (!newClient().waitForName(true)) throw std::runtime_error("the name never came");
    return {nullptr, [this](void*) { stop(); }};
  }
  void stop() {
    log.beginEnding();
    listener.reset();
    listeners.reset();
    queues_.beginEnding();
    queues_.drain(static_cast<double>(kLimit.count()));
  }
  RawBusClient newClient() const { return RawBusClient(bus.address()); }
  bool waitUntilLost() { return lost_.get_future().wait_for(kLimit) == std::future_status::ready; }

  /// Sets the behaviour of every object created from now on.
  void behave(const Behaviour& behaviour) {
    newBehaviour = [behaviour] { return behaviour; };
  }
  static ServiceInterface echoInterface() {
    return {RawBusClient::kInterface,
            {{"EchoRecord", {{"record", "a{sv}"}}, {"record", "a{sv}"}},
             {"EchoRecords", {{"records", "aa{sv}"}}, {"records", "aa{sv}"}},
             {"EchoText", {{"text", "s"}}, {"text", "s"}},
             {"EchoNumber", {{"number", "t"}}, {"number", "t"}},
             {"EchoReal", {{"real", "d"}}, {"real", "d"}},
             {"Record", {{"text", "s"}, {"number", "t"}}, {"record", "a{sv}"}}}};
  }
  bool shouldAcceptNewConnection(ServiceConnection& connection) override {
    decisions.push_back(connection.valueForEntitlement(kEntitlement));
    if (!(decisions.back() == Value(true))) return false;
    connection.setExportedInterface(interface_);
    connection.setExportedObject(std::make_shared<Object>(*this));
    connection.resume();
    return true;
  }

  PrivateBus bus;
  SimulatedLog log;
  /// Creates each object's behaviour; by default it replies with the first argument.
  std::function<Behaviour()> newBehaviour = [] {
    return [](auto&, const Array& arguments, const ServiceReply& reply) { reply(arguments.at(0)); };
  };
  std::function<void()> onObjectGone = [] {};
  std::vector<Value> decisions;  ///< the entitlement's value at each decision

  std::unique_ptr<LocalServiceListeners> listeners;
  std::unique_ptr<ServiceListener> listener;

 protected:
  EventLoop& loop() { return loop_; }
  LocalWorkQueues& queues() { return queues_; }
  const DeviceRoot& deviceRoot() const { return deviceRoot_; }
  const LocalClock& clock() const { return clock_; }

 private:
  struct Object : ServiceObject {
    explicit Object(const BusFixture& test)
        : interface(test.interface_), behaviour(test.newBehaviour()), gone(test.onObjectGone) {}
    ~Object() override { gone(); }
    void invoke(std::size_t method, const Array& arguments, ServiceReply reply) override {
      behaviour(interface.methods[method].member, arguments, std::move(reply));
    }

    const ServiceInterface interface;
    const Behaviour behaviour;
    const std::function<void()> gone;
  };

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
