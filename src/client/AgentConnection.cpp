#include "client/AgentConnection.h"

#include "client/AgentFailures.h"
#include "client/ConnectionState.h"

#include <algorithm>
#include <limits>
#include <utility>

namespace kvr::client {

using namespace bus;  // NOLINT(google-build-using-namespace)

namespace {

using Values = std::function<void(const Result<Value>&)>;

template <class T>
using Answers = AgentConnection::Completion<T>;

template <class Record>
Values asRecord(Answers<Record> completion) {
  return [completion = std::move(completion)](const Result<Value>& reply) {
    if (completion) completion(recordIn<Record>(reply));
  };
}

template <class Record>
Values asRecords(Answers<std::vector<Record>> completion) {
  return [completion = std::move(completion)](const Result<Value>& reply) {
    if (completion) completion(recordsIn<Record>(reply));
  };
}

Values asBool(Answers<bool> completion) {
  return [completion = std::move(completion)](const Result<Value>& reply) {
    if (completion) completion(reply ? Result<bool>(reply->boolean()) : Result<bool>(reply.error()));
  };
}

}  // namespace

Result<AgentConnection> AgentConnection::connect() {
  sd_bus* bus = nullptr;
  const int r = sd_bus_open_user_with_description(&bus, "kvragent client");
  if (r < 0)
    return failure(NoBus, "the session bus cannot be reached: " + std::generic_category().message(-r));
  return AgentConnection(std::make_shared<State>(bus));
}

AgentConnection::AgentConnection(AgentConnection&& other) noexcept = default;

AgentConnection& AgentConnection::operator=(AgentConnection&& other) noexcept {
  std::swap(state_, other.state_);
  return *this;
}

AgentConnection::~AgentConnection() {
  if (state_) state_->close();
}

int AgentConnection::descriptor() const {
  return state_->isLost() ? -1 : std::max(sd_bus_get_fd(state_->bus()), -1);
}

short AgentConnection::events() const {
  return state_->isLost() ? short{0} : static_cast<short>(std::max(sd_bus_get_events(state_->bus()), 0));
}

std::optional<std::chrono::microseconds> AgentConnection::timeout() const { return state_->timeout(); }

int AgentConnection::milliseconds() const {
  const auto wait = timeout();
  if (!wait) return -1;
  const auto rounded = std::chrono::ceil<std::chrono::milliseconds>(*wait).count();
  return static_cast<int>(std::min<std::int64_t>(rounded, std::numeric_limits<int>::max()));
}

bool AgentConnection::dispatch() {
  const auto state = state_;  // a completion may destroy this object
  return state->dispatch();
}

AgentConnection::Call AgentConnection::call(const char* member,
                                            const std::vector<AgentClient::Argument>& arguments,
                                            const char* replyType, Completion<Value> completion,
                                            Limit limit) {
  return state_->call(member, arguments, replyType, std::move(completion), limit);
}

AgentConnection::Call AgentConnection::defaultDevice(Completion<Device> completion, Limit limit) {
  return call("DefaultDevice", {}, "a{sv}", asRecord(std::move(completion)), limit);
}

AgentConnection::Call AgentConnection::pairedDevices(Completion<std::vector<Device>> completion,
                                                     Limit limit) {
  return call("PairedDevices", {}, "aa{sv}", asRecords(std::move(completion)), limit);
}

AgentConnection::Call AgentConnection::defaultDeviceInfo(Policy policy, Completion<DeviceInfo> completion,
                                                         Limit limit) {
  return call("GetDefaultDeviceInfoUsingPolicy", {{"t", argumentOf(policy)}}, "a{sv}",
              asRecord(std::move(completion)), limit);
}

AgentConnection::Call AgentConnection::deviceInfo(const std::string& serialNumber, Policy policy,
                                                  Completion<DeviceInfo> completion, Limit limit) {
  return call("GetDeviceInfoForSerialNumber", {{"s", serialNumber}, {"t", argumentOf(policy)}}, "a{sv}",
              asRecord(std::move(completion)), limit);
}

AgentConnection::Call AgentConnection::allDeviceInfos(Policy policy, bool updateFollowUps,
                                                      Completion<std::vector<DeviceInfo>> completion,
                                                      Limit limit) {
  return call("GetAllDeviceInfosUsingPolicy", {{"t", argumentOf(policy)}, {"b", updateFollowUps}}, "aa{sv}",
              asRecords(std::move(completion)), limit);
}

AgentConnection::Call AgentConnection::dismissFollowUp(const std::string& serialNumber,
                                                       Completion<bool> completion, Limit limit) {
  return call("DismissFollowUpForSerialNumber", {{"s", serialNumber}}, "b", asBool(std::move(completion)),
              limit);
}

AgentConnection::Call AgentConnection::scheduleOutreach(double delay, Completion<bool> completion,
                                                        Limit limit) {
  return call("ScheduleOutreachAfter", {{"d", delay}}, "b", asBool(std::move(completion)), limit);
}

AgentConnection::Call AgentConnection::accountAdded(Completion<bool> completion, Limit limit) {
  return call("TarsilAccountAdded", {}, "b", asBool(std::move(completion)), limit);
}

AgentConnection::Call AgentConnection::supportApplication(const std::string& bundleIdentifier,
                                                          Completion<Value> completion, Limit limit) {
  return call("AppSupportAvailability", {{"s", bundleIdentifier}}, "a{sv}", std::move(completion), limit);
}

bool AgentConnection::cancel(Call call) { return state_->cancel(call); }

void AgentConnection::watch(Completion<Change> handler) { state_->watch(std::move(handler)); }

void AgentConnection::unwatch() { state_->unwatch(); }

}  // namespace kvr::client
