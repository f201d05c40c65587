#include "core/agent/KVRAgentProtocol.h"

#include "platform/names/Names.h"

#include <functional>

namespace kvr {
namespace {

using Arguments = Value::Array;

std::uint64_t unsignedFrom(const Value& number) {
  return number.kind() == Value::Kind::UInt ? number.unsignedInteger()
                                            : static_cast<std::uint64_t>(number.asInteger());
}

// Converts a reply to a bus value: a plain value stays as it is, a record becomes its coded form.

Value coded(const Value& value) { return value; }

template <class Record>
Value coded(const std::shared_ptr<Record>& record) {
  return record ? record->encodeWithCoder() : Value();
}

template <class Record>
Value coded(const std::vector<std::shared_ptr<Record>>& records) {
  Value::Array list;
  list.reserve(records.size());
  for (const auto& record : records) list.push_back(coded(record));
  return list;
}

/// A typed reply that passes its answer on to the connection.
template <class T>
Completion<T> passOn(Log& log, const char* member, const ServiceReply& reply) {
  return Completion<T>(log, member, [reply](const T& answer) { reply(coded(answer)); });
}

/// One operation: its signature on the bus, and the call that serves it.
struct Operation {
  ServiceMethod method;
  std::function<void(KVRAgentProtocol&, const Arguments&, Log&, const ServiceReply&)> call;
};

const std::vector<Operation>& operations() {
  using Agent = KVRAgentProtocol;
  static const std::vector<Operation> kOperations{
      {{"ScheduleOutreach", {}, {"scheduled", "b"}},
       [](Agent& agent, const Arguments&, Log& log, const ServiceReply& reply) {
         agent.scheduleOutreach(passOn<bool>(log, "ScheduleOutreach", reply));
       }},
      {{"ScheduleOutreachAfter", {{"delay", "d"}}, {"scheduled", "b"}},
       [](Agent& agent, const Arguments& in, Log& log, const ServiceReply& reply) {
         agent.scheduleOutreachAfter(in[0].asDouble(), passOn<bool>(log, "ScheduleOutreachAfter", reply));
       }},
      {{"TarsilAccountAdded", {}, {"handled", "b"}},
       [](Agent& agent, const Arguments&, Log& log, const ServiceReply& reply) {
         agent.tarsilAccountAdded(passOn<bool>(log, "TarsilAccountAdded", reply));
       }},
      {{"CheckIsAvailableInStore", {{"bundleIdentifier", "s"}}, {"availability", "a{sv}"}},
       [](Agent& agent, const Arguments& in, Log& log, const ServiceReply& reply) {
         agent.checkIsAvailableInStore(in[0].string(), passOn<Value>(log, "CheckIsAvailableInStore", reply));
       }},
      {{"AppSupportAvailability", {{"bundleIdentifier", "s"}}, {"availability", "a{sv}"}},
       [](Agent& agent, const Arguments& in, Log& log, const ServiceReply& reply) {
         agent.appSupportAvailability(in[0].string(), passOn<Value>(log, "AppSupportAvailability", reply));
       }},
      {{"ReadWebURLOverride", {}, {"url", "s"}},
       [](Agent& agent, const Arguments&, Log& log, const ServiceReply& reply) {
         agent.readWebURLOverride(passOn<Value>(log, "ReadWebURLOverride", reply));
       }},
      {{"DefaultDevice", {}, {"device", "a{sv}"}},
       [](Agent& agent, const Arguments&, Log& log, const ServiceReply& reply) {
         agent.defaultDevice(passOn<KVRDeviceRef>(log, "DefaultDevice", reply));
       }},
      {{"PairedDevices", {}, {"devices", "aa{sv}"}},
       [](Agent& agent, const Arguments&, Log& log, const ServiceReply& reply) {
         agent.pairedDevices(passOn<std::vector<KVRDeviceRef>>(log, "PairedDevices", reply));
       }},
      {{"GetDefaultDeviceInfoUsingPolicy", {{"policy", "t"}}, {"deviceInfo", "a{sv}"}},
       [](Agent& agent, const Arguments& in, Log& log, const ServiceReply& reply) {
         agent.getDefaultDeviceInfoUsingPolicy(
             unsignedFrom(in[0]), passOn<KVRDeviceInfoRef>(log, "GetDefaultDeviceInfoUsingPolicy", reply));
       }},
      {{"GetDeviceInfoForSerialNumber", {{"serialNumber", "s"}, {"policy", "t"}}, {"deviceInfo", "a{sv}"}},
       [](Agent& agent, const Arguments& in, Log& log, const ServiceReply& reply) {
         agent.getDeviceInfoForSerialNumber(
             in[0].string(), unsignedFrom(in[1]),
             passOn<KVRDeviceInfoRef>(log, "GetDeviceInfoForSerialNumber", reply));
       }},
      {{"GetAllDeviceInfosUsingPolicy",
        {{"policy", "t"}, {"updateFollowUps", "b"}},
        {"deviceInfos", "aa{sv}"}},
       [](Agent& agent, const Arguments& in, Log& log, const ServiceReply& reply) {
         agent.getAllDeviceInfosUsingPolicy(
             unsignedFrom(in[0]), in[1].asBool(),
             passOn<KVRDeviceInfoList>(log, "GetAllDeviceInfosUsingPolicy", reply));
       }},
      {{"DismissFollowUpForSerialNumber", {{"serialNumber", "s"}}, {"dismissed", "b"}},
       [](Agent& agent, const Arguments& in, Log& log, const ServiceReply& reply) {
         agent.dismissFollowUpForSerialNumber(in[0].string(),
                                              passOn<bool>(log, "DismissFollowUpForSerialNumber", reply));
       }},
  };
  return kOperations;
}

class AgentServiceObject : public ServiceObject {
 public:
  AgentServiceObject(Log& log, std::shared_ptr<KVRAgentProtocol> agent)
      : log_(log), agent_(std::move(agent)) {}

  void invoke(std::size_t method, const Value::Array& arguments, ServiceReply reply) override {
    operations().at(method).call(*agent_, arguments, log_, reply);
  }

 private:
  Log& log_;
  const std::shared_ptr<KVRAgentProtocol> agent_;
};

}  // namespace

const ServiceInterface& agentServiceInterface() {
  static const ServiceInterface kInterface = [] {
    ServiceInterface interface {
      names::kInterface, {}
    };
    for (const auto& operation : operations()) interface.methods.push_back(operation.method);
    return interface;
  }();
  return kInterface;
}

std::shared_ptr<ServiceObject> newAgentServiceObject(Log& log, std::shared_ptr<KVRAgentProtocol> agent) {
  return std::make_shared<AgentServiceObject>(log, std::move(agent));
}

}  // namespace kvr
