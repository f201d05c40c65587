#include "integration/support/BusFixture.h"

#include <stdlib.h>

#include <filesystem>

namespace kvr::testing {

const ServiceInterface& BusFixture::echoInterface() {
  static const ServiceInterface kInterface{
      RawBusClient::kInterface,
      {{"EchoRecord", {{"record", "a{sv}"}}, {"record", "a{sv}"}},
       {"EchoRecords", {{"records", "aa{sv}"}}, {"records", "aa{sv}"}},
       {"EchoText", {{"text", "s"}}, {"text", "s"}},
       {"EchoNumber", {{"number", "t"}}, {"number", "t"}},
       {"EchoReal", {{"real", "d"}}, {"real", "d"}},
       {"Record", {{"text", "s"}, {"number", "t"}}, {"record", "a{sv}"}}}};
  return kInterface;
}

class BusFixture::Object : public ServiceObject {
 public:
  Object(ServiceInterface interface, Behaviour behaviour, std::function<void()> gone)
      : interface_(std::move(interface)), behaviour_(std::move(behaviour)), gone_(std::move(gone)) {}
  ~Object() override { gone_(); }
  Object(const Object&) = delete;
  Object& operator=(const Object&) = delete;

  void invoke(std::size_t method, const Array& arguments, ServiceReply reply) override {
    behaviour_(interface_.methods[method].member, arguments, std::move(reply));
  }

 private:
  const ServiceInterface interface_;
  const Behaviour behaviour_;
  const std::function<void()> gone_;
};

BusFixture::BusFixture()
    : newBehaviour([] {
        return [](const std::string&, const Array& arguments, const ServiceReply& reply) {
          reply(arguments.at(0));
        };
      }) {
  ::setenv("DBUS_SESSION_BUS_ADDRESS", bus.address().c_str(), 1);
  entitle(true);
  listeners =
      std::make_unique<LocalServiceListeners>(queues_, log, entitlements_, [this] { lost_.set_value(); });
  listener = listeners->newListener(RawBusClient::kName);
  listener->setDelegate(*this);
}

BusFixture::~BusFixture() { stop(); }

void BusFixture::stop() {
  log.beginEnding();
  listener.reset();
  listeners.reset();
  queues_.beginEnding();
  queues_.drain(static_cast<double>(kLimit.count()));
}

void BusFixture::entitle(const Value& value, const std::string& program) {
  const auto path = std::filesystem::canonical(program).string();
  const Dictionary granted{{std::string(kEntitlement), value}};
  const auto problem =
      lists_.write(root_ / "Entitlements.plist", Dictionary{{path, granted}}, PropertyListEncoding::XML);
  if (problem) throw std::runtime_error(describe(*problem));
}

std::shared_ptr<void> BusFixture::serve(const ServiceInterface& interface) {
  interface_ = interface;
  const RawBusClient watcher = newClient();
  const auto handler = [](sd_bus_message*, void* userdata, sd_bus_error*) {
    *static_cast<bool*>(userdata) = true;
    return 0;
  };
  bool isOwned = false;
  const std::string rule = "type='signal',sender='org.freedesktop.DBus',member='NameOwnerChanged',arg0='" +
                           std::string(RawBusClient::kName) + "'";
  if (sd_bus_add_match(watcher.bus(), nullptr, rule.c_str(), handler, &isOwned) < 0) {
    throw std::runtime_error("the name cannot be watched");
  }
  listener->resume(interface);
  while (!isOwned) {
    const int r = sd_bus_process(watcher.bus(), nullptr);
    if (r < 0) throw std::runtime_error("the bus is gone");
    if (r == 0 && sd_bus_wait(watcher.bus(), std::chrono::microseconds(kLimit).count()) == 0) {
      throw std::runtime_error("the name never came");
    }
  }
  return {nullptr, [this](void*) { stop(); }};
}

bool BusFixture::shouldAcceptNewConnection(ServiceConnection& connection) {
  decisions.push_back(connection.valueForEntitlement(kEntitlement));
  if (!(decisions.back() == Value(true))) return false;
  connection.setExportedInterface(interface_);
  connection.setExportedObject(std::make_shared<Object>(interface_, newBehaviour(), onObjectGone));
  connection.resume();
  return true;
}

}  // namespace kvr::testing
