#pragma once

#include "core/agent/KVRAgentProtocol.h"
#include "core/agent/KVRAgentWarrantyProvider.h"
#include "core/devices/KVRAgentDeviceProvider.h"
#include "core/warranty/LookupPolicy.h"
#include "platform/Platform.h"
#include "platform/value/AtomicProperty.h"

#include <memory>
#include <optional>
#include <string>

namespace kvr {

/// Does the work behind every client request.
///
/// Each client connection has its own agent; so do start-up and activities. An agent gets devices from its
/// device provider and warranties from its warranty provider, chooses between cache and download by the
/// lookup policy, and pairs each device with its warranty. Requests run concurrently; a request under way
/// keeps the agent alive. The only state is the two providers, a queue and a work group.
class KVRAgent : public KVRAgentProtocol, public std::enable_shared_from_this<KVRAgent> {
 public:
  /// A warranty, or null.
  using WarrantyReply = Completion<KVRWarrantyRef>;

  /// An agent for the client with this bundle identifier; without one, for the settings application.
  static std::shared_ptr<KVRAgent> initWithCallingProcessBundleID(Platform& platform,
                                                                  std::optional<std::string> bundleID);
  KVRAgent(Platform& platform, std::shared_ptr<KVRAgentWarrantyProvider> warrantyProvider,
           std::shared_ptr<KVRAgentDeviceProvider> deviceProvider);

  void scheduleOutreach(BoolReply withReply) override;
  void scheduleOutreachAfter(double delay, BoolReply withReply) override;
  void tarsilAccountAdded(BoolReply withReply) override;
  void checkIsAvailableInStore(const std::string& bundleIdentifier, DictionaryReply withReply) override;
  void appSupportAvailability(const std::string& bundleIdentifier, DictionaryReply withReply) override;
  void readWebURLOverride(std::optional<StringReply> reply) override;
  void defaultDevice(DeviceReply reply) override;
  void pairedDevices(DevicesReply reply) override;
  void getDefaultDeviceInfoUsingPolicy(std::uint64_t policy, DeviceInfoReply withReply) override;
  void getDeviceInfoForSerialNumber(const std::string& serialNumber, std::uint64_t usingPolicy,
                                    DeviceInfoReply withReply) override;
  void getAllDeviceInfosUsingPolicy(std::uint64_t policy, bool updateFollowUps,
                                    DeviceInfosReply withReply) override;
  void dismissFollowUpForSerialNumber(const std::string& serialNumber, BoolReply completion) override;

  /// Migrates the cache and the follow-up of earlier versions, which knew a single device, to the current
  /// layout, if that was not done before. Synchronous. Call it before anything else reads the cache.
  void performMigrationIfNeeded();

  /// Looks up one device's warranty by the policy. Replies before it returns if nothing is downloaded,
  /// otherwise on the thread on which the download finishes. Accepts any text as a serial number; without
  /// one, replies with null and logs an error.
  void getWarrantyUsingPolicy(std::uint64_t policy, const std::optional<std::string>& serialNumber,
                              const WarrantyReply& withReply);
  /// The same for the local device.
  void getWarrantyUsingPolicy(std::uint64_t policy, const WarrantyReply& withReply);

  AtomicProperty<std::shared_ptr<KVRAgentWarrantyProvider>> warrantyProvider;
  AtomicProperty<std::shared_ptr<KVRAgentDeviceProvider>> deviceProvider;

 private:
  void refreshFollowUp(const KVRDeviceInfoRef& info);
  std::pair<LookupDecision, KVRWarrantyRef> decide(std::uint64_t policy, KVRAgentWarrantyProvider& provider,
                                                   const std::string& serialNumber);
  CacheFacts cacheFacts(KVRAgentWarrantyProvider& provider, const std::string& serialNumber, bool isCached);
  std::string mappedSerialNumber(const std::string& serialNumber);
  KVRDeviceRef deviceFor(const std::string& serialNumber);

  Platform& platform_;
  const WorkQueueRef policyLookupQueue_;
  WorkGroup group_;
};

}  // namespace kvr
