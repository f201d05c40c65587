#include "core/devices/KVRDevicesManager.h"

#include "core/devices/DeviceKeys.h"
#include "core/devices/KVRUtilities.h"
#include "core/warranty/KVRServerVersionUtilities.h"

namespace kvr {
namespace {

std::string describeDevices(const KVRDevices& devices) {
  std::string text = "{";
  for (const auto& [serialNumber, device] : devices)
    text += serialNumber + " = \"" + device->description() + "\"; ";
  return text + "}";
}

}  // namespace

std::shared_ptr<KVRDevicesManager> KVRDevicesManager::sharedManager(Platform& platform) {
  return platform.sharedObjects.get<KVRDevicesManager>([&] { return new KVRDevicesManager(platform); });
}

KVRDeviceRef KVRDevicesManager::defaultDevice() {
  const PropertyListFiles::Look look(platform_.propertyLists);
  const auto serialNumber = localSerialNumber();
  return KVRDevice::deviceWithName(
      platform_.deviceProperties.answer(DeviceProperties::kUserAssignedDeviceName), serialNumber,
      platform_.preferences.dateForKey(preference::kDefaultDeviceActivationDate), KVRDevice::kLocal);
}

std::optional<std::string> KVRDevicesManager::localSerialNumber() const {
  if (KVRUtilities::isInternal(platform_)) {
    auto override = platform_.preferences.stringForKey(preference::kSerialNumber);
    platform_.log.standard("default device SerialNumber Override = %{private}@", override);
    if (override) return override;
  }
  auto serialNumber = platform_.deviceProperties.answer(DeviceProperties::kSerialNumber);
  platform_.log.standard("default device SerialNumber: '%{private}@'", serialNumber);
  return serialNumber;
}

KVRDevices KVRDevicesManager::pairedDevices() {
  constexpr const char* kOperation = "-[KVRDevicesManager pairedDevices]";
  if (!platform_.featureFlags.isEnabled(kFeatureDomain, kPairedWatchesFeature)) {
    platform_.log.standard("Bravik 3.0 disabled by feature flag, ignore paired devices");
    return {};
  }
  if (!KVRServerVersionUtilities::isHighServerVersionFeaturesetEnabled(platform_)) {
    platform_.log.standard("Bravik 3.0 disabled by server, ignore paired devices");
    return {};
  }
  KVRDevices devices;
  Value override;
  if (KVRUtilities::isInternal(platform_)) {
    override = platform_.preferences.objectForKey(preference::kPairedWatchesSerialNumbers);
    if (!override.isDictionary()) override = {};
    platform_.log.debug("%s -> pairedDevices pairedWatchesSerialNumbers overrideDict: %@", kOperation,
                        override);
  }
  if (override.isDictionary()) {
    devices = overriddenWatches(override);
    platform_.log.debug("%s -> pairedDevices internal pairedWatches %@", kOperation,
                        describeDevices(devices));
  } else {
    for (const auto& entry : _activePairedWatches()) {
      if (!entry.serialNumber) continue;
      devices.insert_or_assign(
          *entry.serialNumber,
          KVRDevice::deviceWithName(entry.name ? entry.name : entry.localizedModel, entry.serialNumber,
                                    entry.pairedDate, KVRDevice::kWatch));
    }
  }
  platform_.log.standard("%s - %@", kOperation, describeDevices(devices));
  return devices;
}

KVRDevices KVRDevicesManager::overriddenWatches(const Value& serialNumbers) const {
  KVRDevices devices;
  for (const auto& [ignored, value] : serialNumbers.dictionary()) {
    if (!value.isString()) continue;
    const auto& serialNumber = value.string();
    const double offset =
        platform_.preferences.doubleForKey(serialNumber + std::string(preference::kActivationIntervalSuffix));
    devices.insert_or_assign(serialNumber,
                             KVRDevice::deviceWithName(format("DEBUG:%@", serialNumber), serialNumber,
                                                       platform_.clock.now() + offset, KVRDevice::kWatch));
  }
  return devices;
}

std::vector<PairedDeviceEntry> KVRDevicesManager::_activePairedWatches() const {
  auto entries = platform_.pairedDevices.allDevicesPassing([](const PairedDeviceEntry& entry) {
    return entry.isPaired.value_or(false) && !entry.isArchived.value_or(false);
  });
  platform_.log.standard("%s -> pairedDevices: %@", "-[KVRDevicesManager _activePairedWatches]", entries);
  return entries;
}

KVRDevices KVRDevicesManager::allDevices() {
  KVRDevices devices;
  const auto local = defaultDevice();
  if (local->serialNumber()) devices.emplace(*local->serialNumber(), defaultDevice());
  for (auto& [serialNumber, device] : pairedDevices()) devices.insert_or_assign(serialNumber, device);
  return devices;
}

}  // namespace kvr
