#include "local/bus/BusObservers.h"

#include "platform/names/Names.h"

#include <cerrno>
#include <cstdint>
#include <numeric>
#include <utility>
#include <vector>

namespace kvr {
namespace {

constexpr std::size_t kMostForged = 64;
constexpr std::size_t kEntry = 16;  // what a serial number costs beyond its own length, in bytes

std::size_t sizeOf(const std::set<std::string>& serialNumbers) {
  return std::accumulate(serialNumbers.begin(), serialNumbers.end(), std::size_t{0},
                         [](std::size_t sum, const std::string& one) { return sum + one.size() + kEntry; });
}

/// Adds `more`. If the serial numbers become too many, "any device" takes their place.
void merge(Change& change, const Change& more) {
  change.records.insert(more.records.begin(), more.records.end());
  change.followUps.insert(more.followUps.begin(), more.followUps.end());
  change.devices = change.devices || more.devices;
  if (sizeOf(change.records) + sizeOf(change.followUps) <= BusObservers::kMostListed) return;
  change = {{}, {}, true};
}

/// Appends the serial numbers; negative if the bus can carry none of them, or not this one.
int append(sd_bus_message* message, const std::set<std::string>& serialNumbers) {
  int r = sd_bus_message_open_container(message, 'a', "s");
  for (const std::string& one : serialNumbers) {
    if (r >= 0 && one.find('\0') != std::string::npos) r = -EINVAL;
    if (r >= 0) r = sd_bus_message_append_basic(message, 's', one.c_str());
  }
  return r < 0 ? r : sd_bus_message_close_container(message);
}

int newSignal(sd_bus* bus, const std::string& receiver, const Change& change, BusMessageRef& message) {
  sd_bus_message* made = nullptr;
  int r = sd_bus_message_new_signal(bus, &made, names::kObjectPath, names::kChangesInterface,
                                    names::kChangedMember);
  message.reset(made);
  if (r >= 0) r = sd_bus_message_set_destination(made, receiver.c_str());
  if (r >= 0) r = append(made, change.records);
  if (r >= 0) r = append(made, change.followUps);
  const int devices = change.devices ? 1 : 0;
  return r < 0 ? r : sd_bus_message_append_basic(made, 'b', &devices);
}

}  // namespace

const ServiceInterface& changesInterface() {
  static const ServiceInterface kChanges{
      names::kChangesInterface,
      {{"Subscribe", {}, {"isNew", "b"}}, {"Unsubscribe", {}, {"wasSubscribed", "b"}}}};
  return kChanges;
}

void BusObservers::tell(const Change& change) {
  if (!areThere() || change.isNone()) return;
  const std::lock_guard lock(mutex_);
  const bool isFirst = news_.isNone();
  merge(news_, change);
  if (isFirst) thread_->post([self = shared_from_this()] { self->tellAll(); });
}

void BusObservers::tellAll() {
  Change news;
  {
    const std::lock_guard lock(mutex_);
    news = std::exchange(news_, {});
  }
  std::vector<Observer*> ready;
  for (auto& [name, observer] : observers_) {
    merge(observer.untold, news);
    if (!observer.question) ready.push_back(&observer);
  }
  for (Observer* const observer : ready) tellOne(*observer);
}

void BusObservers::tellOne(Observer& observer) {
  int r = send(observer);
  if (r >= 0) r = ask(observer);
  if (r < 0) return lose(observer.name, describe(busError(r, "the bus does not take it")));
  observer.untold = {};
}

int BusObservers::send(const Observer& observer) {
  BusMessageRef message;
  int r = newSignal(observer.bus, observer.name, observer.untold, message);
  // A serial number may hold what the bus cannot carry.
  if (r == -EINVAL) r = newSignal(observer.bus, observer.name, {{}, {}, true}, message);
  return r < 0 ? r : sd_bus_send(observer.bus, message.get(), nullptr);
}

int BusObservers::ask(Observer& observer) {
  sd_bus_message* made = nullptr;
  int r = sd_bus_message_new_method_call(observer.bus, &made, observer.name.c_str(), "/",
                                         "org.freedesktop.DBus.Peer", "Ping");
  const BusMessageRef message(made);
  sd_bus_slot* slot = nullptr;
  if (r >= 0) r = sd_bus_call_async(observer.bus, &slot, made, handleRead, &observer, UINT64_MAX);
  observer.question.reset(slot);
  return r;
}

int BusObservers::handleRead(sd_bus_message* message, void* userdata, sd_bus_error*) {
  return guardedBusCallback([&] {
    Observer& observer = *static_cast<Observer*>(userdata);
    BusObservers& self = *observer.owner;
    observer.question.reset();
    const char* const sender = sd_bus_message_get_sender(message);
    if (sender && sender == observer.name) {
      // Whatever it answers, it has read the signal.
      observer.forged = 0;
      if (!observer.untold.isNone()) self.tellOne(observer);
    } else if (isFromBus(message)) {
      const sd_bus_error* const error = sd_bus_message_get_error(message);
      self.lose(observer.name, error ? error->name : "the bus answers in its place");
    } else if (++observer.forged > kMostForged || ask(observer) < 0) {
      self.lose(observer.name, "others answer in its place");
    }
    return 0;
  });
}

// A copy: the caller's name may belong to the observer that is removed.
// NOLINTNEXTLINE(performance-unnecessary-value-param)
void BusObservers::lose(std::string name, const std::string& why) {
  const bool hasLeft = why == SD_BUS_ERROR_NO_REPLY || why == SD_BUS_ERROR_SERVICE_UNKNOWN;
  if (!hasLeft) log_.error("Connection %@ is told of no more changes: %@", name, why);
  remove(name);
}

bool BusObservers::add(sd_bus* bus, const std::string& name) {
  const auto [found, isNew] = observers_.try_emplace(name);
  if (!isNew) return false;
  found->second.name = name;
  found->second.owner = this;
  found->second.bus = bus;
  count_ = observers_.size();
  return true;
}

bool BusObservers::remove(const std::string& name) {
  const bool wasThere = observers_.erase(name) > 0;
  count_ = observers_.size();
  return wasThere;
}

void BusObservers::close() {
  observers_.clear();
  count_ = 0;
}

}  // namespace kvr
