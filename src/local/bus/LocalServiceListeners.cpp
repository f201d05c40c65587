#include "local/bus/LocalServiceListeners.h"

#include "local/bus/BusService.h"

#include <chrono>
#include <cstdlib>
#include <future>
#include <utility>

namespace kvr {
namespace {

constexpr std::chrono::seconds kEndingLimit{2};

}  // namespace

class LocalServiceListeners::Listener : public ServiceListener {
 public:
  Listener(LocalServiceListeners& owner, std::string name) : owner_(owner), name_(std::move(name)) {}
  ~Listener() override {
    delegate_->set(nullptr);
    if (service_) owner_.close(service_);
  }
  Listener(const Listener&) = delete;
  Listener& operator=(const Listener&) = delete;

  void setDelegate(ServiceListenerDelegate& delegate) override { delegate_->set(&delegate); }

  void resume(const ServiceInterface& interface) override {
    if (service_) return;
    LocalServiceListeners& owner = owner_;
    service_ = std::make_shared<BusService>(
        BusService::Settings{owner.connection_, owner.log_, name_,
                             [&owner](const Error& error) { owner.lose(error); }},
        BusClient::Context{owner.queues_, owner.log_, owner.entitlements_, owner.connection_.thread(),
                           owner.queues_.newSerialQueue(name_ + ".listener"), delegate_, interface,
                           owner.openCalls_, owner.observers_, nullptr});
    owner.open(service_);
  }

 private:
  LocalServiceListeners& owner_;
  const std::string name_;
  const std::shared_ptr<DelegateGate> delegate_ = std::make_shared<DelegateGate>();
  std::shared_ptr<BusService> service_;
};

LocalServiceListeners::LocalServiceListeners(WorkQueues& queues, Log& log,
                                             const LocalEntitlements& entitlements,
                                             std::function<void()> busLost)
    : queues_(queues),
      log_(log),
      entitlements_(entitlements),
      busLost_(std::move(busLost)),
      connection_(log, [this](const Error& error) { lose(error); }),
      observers_(std::make_shared<BusObservers>(connection_.thread(), log)) {}

LocalServiceListeners::~LocalServiceListeners() {
  connection_.thread()->post([this] {
    for (const auto& service : std::exchange(services_, {})) service->close();
  });
}

std::unique_ptr<ServiceListener> LocalServiceListeners::newListener(std::string name) {
  return std::make_unique<Listener>(*this, std::move(name));
}

void LocalServiceListeners::open(const std::shared_ptr<BusService>& service) {
  connection_.thread()->post([this, service] {
    services_.push_back(service);
    service->open();
  });
}

void LocalServiceListeners::close(const std::shared_ptr<BusService>& service) {
  connection_.thread()->post([this, service] {
    std::erase(services_, service);
    service->close();
  });
}

void LocalServiceListeners::lose(const Error& error) {
  const std::function<void()> busLost = std::exchange(busLost_, nullptr);
  if (!busLost) return;
  log_.error("The agent cannot serve any more: %@", error);
  for (const auto& service : services_) service->close();
  busLost();
}

bool LocalServiceListeners::isActivatable(const std::string& name) {
  const auto answer = std::make_shared<std::promise<bool>>();
  std::future<bool> future = answer->get_future();
  connection_.thread()->post([this, name, answer] {
    sd_bus* const bus = connection_.bus();
    sd_bus_message* made = nullptr;
    char** names = nullptr;
    bool found = false;
    if (bus != nullptr &&
        sd_bus_call_method(bus, "org.freedesktop.DBus", "/org/freedesktop/DBus", "org.freedesktop.DBus",
                           "ListActivatableNames", nullptr, &made, "") >= 0 &&
        isFromBus(made) && sd_bus_message_read_strv(made, &names) >= 0) {
      for (char** each = names; each != nullptr && *each != nullptr; ++each) {
        found = found || name == *each;
        std::free(*each);
      }
      std::free(static_cast<void*>(names));
    }
    const BusMessageRef reply(made);
    answer->set_value(found);
  });
  return future.wait_for(kEndingLimit) == std::future_status::ready && future.get();
}

void LocalServiceListeners::beginEnding() {
  const auto ended = std::make_shared<std::promise<void>>();
  const std::future<void> future = ended->get_future();
  connection_.thread()->post([this, ended] {
    const std::shared_ptr<void> last(nullptr, [ended](void*) { ended->set_value(); });
    for (const auto& service : services_) service->beginEnding([last] {});
  });
  future.wait_for(kEndingLimit);
}

}  // namespace kvr
