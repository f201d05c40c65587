#pragma once

#include "core/devices/KVRDeviceInfo.h"
#include "platform/log/Completion.h"
#include "platform/services/ServiceListener.h"

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace kvr {

using BoolReply = Completion<bool>;
/// A dictionary, or null for nothing.
using DictionaryReply = Completion<Value>;
/// A string, or null for nothing.
using StringReply = Completion<Value>;
using DeviceReply = Completion<KVRDeviceRef>;
using DevicesReply = Completion<std::vector<KVRDeviceRef>>;
using DeviceInfoReply = Completion<KVRDeviceInfoRef>;
using DeviceInfosReply = Completion<KVRDeviceInfoList>;

/// The operations that clients can call. Each calls its reply exactly once, on the thread on which the work
/// finishes; none reports an error. A policy is a value of `LookupPolicy`.
class KVRAgentProtocol {
 public:
  virtual ~KVRAgentProtocol() = default;

  virtual void scheduleOutreach(BoolReply withReply) = 0;
  /// `delay` in seconds.
  virtual void scheduleOutreachAfter(double delay, BoolReply withReply) = 0;
  /// Reports that a primary cloud account was added. The reply can take as long as the outreach delay and the
  /// downloads after it.
  virtual void tarsilAccountAdded(BoolReply withReply) = 0;
  virtual void checkIsAvailableInStore(const std::string& bundleIdentifier, DictionaryReply withReply) = 0;
  virtual void appSupportAvailability(const std::string& bundleIdentifier, DictionaryReply withReply) = 0;
  /// `reply` may be missing.
  virtual void readWebURLOverride(std::optional<StringReply> reply) = 0;
  virtual void defaultDevice(DeviceReply reply) = 0;
  /// In no particular order.
  virtual void pairedDevices(DevicesReply reply) = 0;
  /// Replies with a record in any case; its warranty is null when none is known.
  virtual void getDefaultDeviceInfoUsingPolicy(std::uint64_t policy, DeviceInfoReply withReply) = 0;
  virtual void getDeviceInfoForSerialNumber(const std::string& serialNumber, std::uint64_t usingPolicy,
                                            DeviceInfoReply withReply) = 0;
  /// One record per device, in no particular order.
  virtual void getAllDeviceInfosUsingPolicy(std::uint64_t policy, bool updateFollowUps,
                                            DeviceInfosReply withReply) = 0;
  virtual void dismissFollowUpForSerialNumber(const std::string& serialNumber, BoolReply completion) = 0;
};

/// The protocol as clients see it on the bus: members, argument names and types.
const ServiceInterface& agentServiceInterface();

/// Makes an object that serves one connection's calls with `agent`.
std::shared_ptr<ServiceObject> newAgentServiceObject(Log& log, std::shared_ptr<KVRAgentProtocol> agent);

}  // namespace kvr
