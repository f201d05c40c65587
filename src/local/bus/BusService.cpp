#include "local/bus/BusService.h"

#include "local/bus/BusIntrospection.h"

#include <algorithm>
#include <cerrno>
#include <utility>

namespace kvr {
namespace {

/// The most connections that have called and not left; further ones get an error.
constexpr std::size_t kMostClients = 4096;

// The bus's answers to a request for a name.
constexpr std::uint32_t kIsOwner = 1;
constexpr std::uint32_t kWasOwner = 4;

std::string pathFor(const std::string& name) {
  std::string path = "/" + name;
  std::replace(path.begin(), path.end(), '.', '/');
  return path;
}

}  // namespace

BusService::BusService(Settings settings, BusClient::Context context)
    : settings_(std::move(settings)), path_(pathFor(settings_.name)) {
  context.unread = std::make_shared<UnreadReplies>(settings_.log);
  context.forget = [this](const std::string& uniqueName) { forget(uniqueName); };
  context_ = std::make_shared<const BusClient::Context>(std::move(context));
}

void BusService::open() {
  sd_bus* const bus = settings_.connection.bus();
  if (!bus) return;
  if (const int r = offer(bus); r < 0) fail(describe(busError(r, "it cannot be offered")));
}

int BusService::offer(sd_bus* bus) {
  sd_bus_slot* slot = nullptr;
  int r = sd_bus_add_object(bus, &slot, path_.c_str(), handleCall, this);
  if (r < 0) return r;
  object_.reset(slot);
  r = sd_bus_add_filter(bus, &slot, handleAny, this);
  if (r < 0) return r;
  filter_.reset(slot);
  return requestName(bus);
}

int BusService::requestName(sd_bus* bus) {
  sd_bus_slot* slot = nullptr;
  const int r = sd_bus_request_name_async(bus, &slot, settings_.name.c_str(), 0, handleNameRequested, this);
  nameRequest_.reset(slot);
  return r;
}

int BusService::handleNameRequested(sd_bus_message* message, void* userdata, sd_bus_error*) {
  return guardedBusCallback([&] {
    const auto self = static_cast<BusService*>(userdata)->shared_from_this();
    if (!isFromBus(message)) return self->requestName(sd_bus_message_get_bus(message));
    std::uint32_t answer = 0;
    const sd_bus_error* const error = sd_bus_message_get_error(message);
    if (error) {
      self->fail(error->message ? error->message : error->name);
    } else if (sd_bus_message_read(message, "u", &answer) < 0 ||
               (answer != kIsOwner && answer != kWasOwner)) {
      self->fail("somebody else has it");
    }
    return 0;
  });
}

int BusService::handleAny(sd_bus_message* message, void* userdata, sd_bus_error*) {
  if (sd_bus_message_is_method_call(message, nullptr, nullptr)) {
    return guardedBusCallback(
        [&] { return static_cast<BusService*>(userdata)->context_->unread->admit(message) ? 0 : 1; });
  }
  if (!sd_bus_message_is_signal(message, kBusName, "NameLost")) return 0;
  return guardedBusCallback([&] {
    const auto self = static_cast<BusService*>(userdata)->shared_from_this();
    const char* const sender = sd_bus_message_get_sender(message);
    const char* name = nullptr;
    const bool isTrue =
        sender && std::string_view(sender) == kBusName && sd_bus_message_read(message, "s", &name) >= 0;
    if (isTrue && name == self->settings_.name && !self->isGivingUp_) self->fail("somebody has taken it");
    return 0;
  });
}

int BusService::handleCall(sd_bus_message* message, void* userdata, sd_bus_error*) {
  return guardedBusCallback([&] {
    const auto self = static_cast<BusService*>(userdata)->shared_from_this();
    return self->take(message) ? 1 : 0;
  });
}

/// Whether the call was for the service; the bus library answers the others.
bool BusService::take(sd_bus_message* message) {
  if (sd_bus_message_is_method_call(message, "org.freedesktop.DBus.Introspectable", "Introspect")) {
    const Value document = introspectionDocument(context_->interface);
    const char* const sender = sd_bus_message_get_sender(message);
    if (sender && context_->unread->maySend(sd_bus_message_get_bus(message), sender, document)) {
      replyToBusCall(message, "s", document);
    }
    return true;
  }
  const char* const interface = sd_bus_message_get_interface(message);
  const bool isOurs = !interface || std::string_view(interface) == context_->interface.name ||
                      std::string_view(interface) == changesInterface().name;
  if (!isOurs) return false;
  receive(message);
  return true;
}

void BusService::receive(sd_bus_message* call) {
  const char* const sender = sd_bus_message_get_sender(call);
  if (hasEnded_ || !sender) return failBusCall(call, kBusErrorFailed, "the service is ending");
  auto found = clients_.find(std::string_view(sender));
  if (found == clients_.end()) {
    if (clients_.size() >= kMostClients) {
      return failBusCall(call, kBusErrorTooMany, "too many connections");
    }
    const auto client = std::make_shared<BusClient>(context_, sender);
    if (const auto error = client->begin(sd_bus_message_get_bus(call))) {
      client->close();
      return failBusCall(call, kBusErrorFailed, error->message);
    }
    found = clients_.emplace(sender, client).first;
  }
  const auto client = found->second;
  client->receive(call);
}

void BusService::forget(const std::string& uniqueName) {
  const auto found = clients_.find(uniqueName);
  if (found == clients_.end()) return;
  const auto client = std::move(found->second);
  clients_.erase(found);
  client->close();
}

void BusService::fail(const std::string& why) {
  settings_.failed({"bus", 0, "the name " + settings_.name + " is not ours: " + why});
}

void BusService::beginEnding(Work done) {
  sd_bus* const bus = settings_.connection.bus();
  sd_bus_slot* slot = nullptr;
  isGivingUp_ = true;
  done_ = std::move(done);
  const int r = bus && object_
                    ? sd_bus_release_name_async(bus, &slot, settings_.name.c_str(), handleNameReleased, this)
                    : -ENOTCONN;
  nameRequest_.reset(slot);
  if (r < 0) end();
}

int BusService::handleNameReleased(sd_bus_message*, void* userdata, sd_bus_error*) {
  return guardedBusCallback([&] {
    static_cast<BusService*>(userdata)->shared_from_this()->end();
    return 0;
  });
}

void BusService::end() {
  hasEnded_ = true;
  if (const Work done = std::exchange(done_, nullptr)) done();
}

void BusService::close() {
  hasEnded_ = true;
  nameRequest_.reset();
  filter_.reset();
  object_.reset();
  for (const auto& [name, client] : std::exchange(clients_, {})) client->close();
  context_->unread->close();
  context_->observers->close();
  done_ = nullptr;
}

}  // namespace kvr
