#include "client/AgentClient.h"

#include "client/AgentFailures.h"
#include "local/buscodec/BusHandles.h"
#include "platform/names/Names.h"

#include <cerrno>
#include <utility>

namespace kvr::client {

using namespace bus;  // NOLINT(google-build-using-namespace)

namespace {

constexpr std::uint64_t kSecond = 1'000'000;  // microseconds

}  // namespace

Result<AgentClient> AgentClient::connect() {
  sd_bus* bus = nullptr;
  const int r = sd_bus_open_user_with_description(&bus, "kvragent client");
  if (r < 0)
    return failure(NoBus, "the session bus cannot be reached: " + std::generic_category().message(-r));
  return AgentClient(bus);
}

void AgentClient::Close::operator()(sd_bus* bus) const { sd_bus_close_unref(bus); }

bool AgentClient::isAgentRunning() const {
  sd_bus_message* answer = nullptr;
  int isOwned = 0;
  const int r =
      sd_bus_call_method(bus_.get(), "org.freedesktop.DBus", "/org/freedesktop/DBus", "org.freedesktop.DBus",
                         "NameHasOwner", nullptr, &answer, "s", names::kAgent);
  const BusMessageRef reply(answer);
  return r >= 0 && sd_bus_message_read(answer, "b", &isOwned) >= 0 && isOwned != 0;
}

Result<Value> AgentClient::call(const char* member, const std::vector<Argument>& arguments,
                                const char* replyType) const {
  const Result<BusMessageRef> message = newCall(bus_.get(), member, arguments);
  if (!message) return message.error();
  sd_bus_message* answer = nullptr;
  sd_bus_slot* pending = nullptr;
  const auto keep = [](sd_bus_message* given, void* kept, sd_bus_error*) {
    *static_cast<sd_bus_message**>(kept) = sd_bus_message_ref(given);
    return 0;
  };
  int r = sd_bus_call_async(bus_.get(), &pending, message->get(), keep, static_cast<void*>(&answer),
                            static_cast<std::uint64_t>(patience_) * kSecond);
  const BusSlotRef slot(pending);
  for (int seconds = 0; r >= 0 && answer == nullptr;) {
    r = sd_bus_process(bus_.get(), nullptr);
    if (r != 0) continue;
    r = sd_bus_wait(bus_.get(), kSecond);
    if (r == 0 && waiting_) waiting_(++seconds);
  }
  const BusMessageRef reply(answer);
  if (answer == nullptr) return failureOf(r, BusError());
  return valueIn(answer, replyType);
}

Result<Device> AgentClient::defaultDevice() const {
  return recordIn<Device>(call("DefaultDevice", {}, "a{sv}"));
}

Result<std::vector<Device>> AgentClient::pairedDevices() const {
  return recordsIn<Device>(call("PairedDevices", {}, "aa{sv}"));
}

Result<DeviceInfo> AgentClient::defaultDeviceInfo(Policy policy) const {
  return recordIn<DeviceInfo>(call("GetDefaultDeviceInfoUsingPolicy", {{"t", argumentOf(policy)}}, "a{sv}"));
}

Result<DeviceInfo> AgentClient::deviceInfo(const std::string& serialNumber, Policy policy) const {
  return recordIn<DeviceInfo>(
      call("GetDeviceInfoForSerialNumber", {{"s", serialNumber}, {"t", argumentOf(policy)}}, "a{sv}"));
}

Result<std::vector<DeviceInfo>> AgentClient::allDeviceInfos(Policy policy, bool updateFollowUps) const {
  return recordsIn<DeviceInfo>(
      call("GetAllDeviceInfosUsingPolicy", {{"t", argumentOf(policy)}, {"b", updateFollowUps}}, "aa{sv}"));
}

Result<bool> AgentClient::dismissFollowUp(const std::string& serialNumber) const {
  const Result<Value> reply = call("DismissFollowUpForSerialNumber", {{"s", serialNumber}}, "b");
  if (!reply) return reply.error();
  return reply->boolean();
}

Result<bool> AgentClient::scheduleOutreach(double delay) const {
  const Result<Value> reply = call("ScheduleOutreachAfter", {{"d", delay}}, "b");
  if (!reply) return reply.error();
  return reply->boolean();
}

Result<bool> AgentClient::accountAdded() const {
  const Result<Value> reply = call("TarsilAccountAdded", {}, "b");
  if (!reply) return reply.error();
  return reply->boolean();
}

Result<Value> AgentClient::supportApplication(const std::string& bundleIdentifier) const {
  return call("AppSupportAvailability", {{"s", bundleIdentifier}}, "a{sv}");
}

Result<std::optional<std::string>> AgentClient::webURLOverride() const {
  const Result<Value> reply = call("ReadWebURLOverride", {}, "s");
  if (!reply) return reply.error();
  return reply->string().empty() ? std::nullopt : std::optional(reply->string());
}

std::optional<Error> AgentClient::tell(const char* member) const {
  sd_bus_message* made = nullptr;
  int r = sd_bus_message_new_method_call(bus_.get(), &made, names::kAgent, names::kObjectPath,
                                         names::kInterface, member);
  const BusMessageRef message(made);
  if (r >= 0) r = sd_bus_send(bus_.get(), made, nullptr);
  if (r >= 0) r = sd_bus_flush(bus_.get());
  return r < 0 ? std::optional(failureOf(r, BusError())) : std::nullopt;
}

std::optional<Error> AgentClient::post(const std::string& notification) const {
  int r = sd_bus_emit_signal(bus_.get(), names::kNotificationPath, names::kNotificationInterface,
                             names::kNotificationMember, "s", notification.c_str());
  if (r >= 0) r = sd_bus_flush(bus_.get());
  return r < 0 ? std::optional(failureOf(r, BusError())) : std::nullopt;
}

}  // namespace kvr::client
