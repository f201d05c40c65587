#include "core/agent/KVRAgent.h"

#include "core/agent/AgentKeys.h"
#include "core/agent/KVRAgentDefaultWarrantyProvider.h"
#include "core/devices/DeviceKeys.h"
#include "core/devices/KVRDevicesManager.h"
#include "core/devices/KVRUtilities.h"
#include "core/scheduling/KVRScheduler.h"
#include "core/scheduling/SchedulingKeys.h"
#include "core/support/KVRTarsilSupportManager.h"
#include "core/warranty/KVRServerVersionUtilities.h"
#include "core/warranty/WarrantyKeys.h"
#include "platform/names/Names.h"

#include <mutex>

namespace kvr {
namespace {

/// The migration level of the current data layout. Levels 0 (none stored) and 1 mean the single-device
/// layout.
constexpr std::int32_t kCurrentLayout = 2;

}  // namespace

std::shared_ptr<KVRAgent> KVRAgent::initWithCallingProcessBundleID(Platform& platform,
                                                                   std::optional<std::string> bundleID) {
  if (!bundleID) {
    platform.log.standard("%s: callingProcessBundleID is nil. Falling back to Preferences Bundle ID",
                          "-[KVRAgent initWithCallingProcessBundleID:]");
    bundleID = kPreferencesBundleID;
  }
  return std::make_shared<KVRAgent>(platform,
                                    std::make_shared<KVRAgentDefaultWarrantyProvider>(platform, *bundleID),
                                    KVRDevicesManager::sharedManager(platform));
}

KVRAgent::KVRAgent(Platform& platform, std::shared_ptr<KVRAgentWarrantyProvider> theWarrantyProvider,
                   std::shared_ptr<KVRAgentDeviceProvider> theDeviceProvider)
    : warrantyProvider(std::move(theWarrantyProvider)),
      deviceProvider(std::move(theDeviceProvider)),
      platform_(platform),
      policyLookupQueue_(platform.queues.newSerialQueue("com.tarsil.kavrel.kvragent.policyqueue")) {}

void KVRAgent::scheduleOutreach(BoolReply withReply) { scheduleOutreachAfter(0, std::move(withReply)); }

void KVRAgent::scheduleOutreachAfter(double delay, BoolReply withReply) {
  if (isInCalendar(platform_.clock.now() + delay)) {
    KVRScheduler::newSchedulerForActivity(platform_, names::kOutreach)
        ->scheduleActivityWithDelay(delay, RegistrationCause::Demand);
  } else {
    platform_.log.error("%s: delay refused, no date lies %f seconds ahead",
                        "-[KVRAgent scheduleOutreachAfter:withReply:]", delay);
  }
  withReply(true);
}

void KVRAgent::tarsilAccountAdded(BoolReply withReply) {
  constexpr const char* kOperation = "-[KVRAgent tarsilAccountAddedWithReply:]";
  auto& preferences = platform_.preferences;
  if (!preferences.boolForKey(preference::kPostUpgradeActivityCompleted)) {
    platform_.log.standard("%s: Skipped scheduling/downloading new warranty", kOperation);
    withReply(false);
    return;
  }
  const double delay = preferences.doubleForKey(preference::kPostUpgradeOutreachDelay);
  if (preferences.boolForKey(preference::kInitialOutreachActivityScheduled)) {
    platform_.log.standard("%s: New warranty to be downloaded after: %f", kOperation, delay);
    const auto background = platform_.queues.concurrentQueue(Priority::Background);
    platform_.queues.after(delay, background, [self = shared_from_this(), withReply] {
      self->getAllDeviceInfosUsingPolicy(
          LookupPolicy::kRefresh, false,
          DeviceInfosReply(self->platform_.log, "tarsilAccountAdded",
                           [withReply](const KVRDeviceInfoList&) { withReply(true); }));
    });
    return;
  }
  platform_.log.standard("%s: Outreach to be scheduled after: %f", kOperation, delay);
  scheduleOutreachAfter(delay, std::move(withReply));
  preferences.setObject(true, preference::kInitialOutreachActivityScheduled);
}

void KVRAgent::checkIsAvailableInStore(const std::string& bundleIdentifier, DictionaryReply withReply) {
  platform_.log.standard("Checking for %@ in the Quillmart", bundleIdentifier);
  KVRTarsilSupportManager(platform_).checkIsAvailableInStore(bundleIdentifier, withReply);
}

void KVRAgent::appSupportAvailability(const std::string& bundleIdentifier, DictionaryReply withReply) {
  platform_.log.standard("Availability for %@", bundleIdentifier);
  KVRTarsilSupportManager(platform_).appSupportAvailability(bundleIdentifier, withReply);
}

void KVRAgent::performMigrationIfNeeded() {
  const auto provider = warrantyProvider();
  if (provider->migrationVersion() >= kCurrentLayout) return;
  const auto device = deviceProvider()->defaultDevice();
  const auto serialNumber = device->serialNumber();
  KVRWarrantyRef warranty;
  if (serialNumber) warranty = provider->migrateLegacyCachedWarrantyIfNeededForSerialNumber(*serialNumber);
  provider->migrateLegacyFollowUpIfNeededWithDeviceInfo(
      KVRDeviceInfo::deviceInfoWithDevice(device, warranty));
  provider->setMigrationVersion(kCurrentLayout);
}

void KVRAgent::readWebURLOverride(std::optional<StringReply> reply) {
  Value url;
  if (KVRUtilities::isInternal(platform_)) {
    url = KVRServerVersionUtilities::readWebURLOverride(platform_);
    platform_.log.standard("readWebURLOverride = %@", url);
  }
  if (reply) (*reply)(url.isString() ? url : Value());
}

void KVRAgent::defaultDevice(DeviceReply reply) { reply(deviceProvider()->defaultDevice()); }

void KVRAgent::pairedDevices(DevicesReply reply) {
  std::vector<KVRDeviceRef> devices;
  for (const auto& [serialNumber, device] : deviceProvider()->pairedDevices()) devices.push_back(device);
  reply(std::move(devices));
}

void KVRAgent::getDefaultDeviceInfoUsingPolicy(std::uint64_t policy, DeviceInfoReply withReply) {
  const auto device = deviceProvider()->defaultDevice();
  getWarrantyUsingPolicy(
      policy, device->serialNumber(),
      WarrantyReply(platform_.log, "getDefaultDeviceInfoUsingPolicy",
                    [self = shared_from_this(), device, withReply](const KVRWarrantyRef& warranty) {
                      const KVRDeviceInfoRef info = KVRDeviceInfo::deviceInfoWithDevice(device, warranty);
                      self->platform_.log.standard("getDefaultDeviceInfoUsingPolicy for device: '%@'", info);
                      withReply(info);
                      self->refreshFollowUp(info);
                    }));
}

/// Does nothing while the process is ending: a look-up may then have failed for that reason alone, and the
/// follow-up must not be removed for it.
void KVRAgent::refreshFollowUp(const KVRDeviceInfoRef& info) {
  if (!platform_.cleanExit.isEnding()) warrantyProvider()->refreshFollowupWithDeviceInfo(info);
}

std::string KVRAgent::mappedSerialNumber(const std::string& serialNumber) {
  const auto watches = platform_.preferences.objectForKey(preference::kPairedWatchesSerialNumbers);
  const auto accessories =
      platform_.preferences.objectForKey(preference::kPairedBluetoothDevicesSerialNumbers);
  if (!watches.isDictionary() && !accessories.isDictionary()) return serialNumber;
  auto mapped = watches[serialNumber];
  if (mapped.isNull()) mapped = accessories[serialNumber];
  platform_.log.debug("serialNumberOverride for Serial Number: %@ with serial: %@", serialNumber, mapped);
  if (!mapped.isString()) return serialNumber;
  platform_.log.debug("Override Serial Number: %@ found for SN: %@", mapped, serialNumber);
  return mapped.string();
}

KVRDeviceRef KVRAgent::deviceFor(const std::string& serialNumber) {
  const auto devices = deviceProvider()->allDevices();
  const auto found = devices.find(serialNumber);
  if (found != devices.end()) return found->second;
  return KVRDevice::deviceWithName("<unknown>", serialNumber, std::nullopt, KVRDevice::kOther);
}

void KVRAgent::getDeviceInfoForSerialNumber(const std::string& serialNumber, std::uint64_t usingPolicy,
                                            DeviceInfoReply withReply) {
  const auto mapped = mappedSerialNumber(serialNumber);
  getWarrantyUsingPolicy(
      usingPolicy, mapped,
      WarrantyReply(platform_.log, "getDeviceInfoForSerialNumber",
                    [self = shared_from_this(), mapped, withReply](const KVRWarrantyRef& warranty) {
                      const KVRDeviceInfoRef info =
                          KVRDeviceInfo::deviceInfoWithDevice(self->deviceFor(mapped), warranty);
                      self->platform_.log.standard("getDeviceInfoForSerialNumber for device: '%@'", info);
                      withReply(info);
                      self->refreshFollowUp(info);
                    }));
}

void KVRAgent::getAllDeviceInfosUsingPolicy(std::uint64_t policy, bool updateFollowUps,
                                            DeviceInfosReply withReply) {
  struct Results {
    std::mutex mutex;
    KVRDeviceInfoList list;
  };
  const auto results = std::make_shared<Results>();
  const auto self = shared_from_this();
  for (const auto& entry : deviceProvider()->allDevices()) {
    group_.enter();
    // Owned by the reply, so the group is left even if a look-up drops its reply without an answer.
    const std::shared_ptr<void> entered(nullptr, [self](void*) { self->group_.leave(); });
    getWarrantyUsingPolicy(
        policy, entry.first,
        WarrantyReply(platform_.log, "getAllDeviceInfosUsingPolicy",
                      [results, entered, device = entry.second](const KVRWarrantyRef& warranty) {
                        const std::lock_guard lock(results->mutex);
                        results->list.push_back(KVRDeviceInfo::deviceInfoWithDevice(device, warranty));
                      }));
  }
  group_.notify(policyLookupQueue_, [self, results, updateFollowUps, withReply] {
    KVRDeviceInfoList list;
    {
      const std::lock_guard lock(results->mutex);
      list = results->list;
    }
    self->platform_.log.standard("getAllDeviceInfosUsingPolicy: '%@'", list);
    if (updateFollowUps && !self->platform_.cleanExit.isEnding()) {
      self->warrantyProvider()->refreshFollowupWithDeviceInfos(list);
    }
    withReply(std::move(list));
  });
}

void KVRAgent::dismissFollowUpForSerialNumber(const std::string& serialNumber, BoolReply completion) {
  warrantyProvider()->dismissFollowUpForSerialNumber(serialNumber);
  completion(true);
}

}  // namespace kvr
