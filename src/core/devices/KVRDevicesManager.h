#pragma once

#include "core/devices/KVRAgentDeviceProvider.h"
#include "platform/Platform.h"

#include <memory>
#include <vector>

namespace kvr {

/// Finds the local device and, while the feature flag and the service's version allow, the watches paired
/// with it. No state: every call queries the platform and builds new records. Any thread.
class KVRDevicesManager : public KVRAgentDeviceProvider {
 public:
  explicit KVRDevicesManager(Platform& platform) : platform_(platform) {}
  /// The platform's one manager, made on first use.
  static std::shared_ptr<KVRDevicesManager> sharedManager(Platform& platform);

  KVRDeviceRef defaultDevice() override;
  KVRDevices pairedDevices() override;
  KVRDevices allDevices() override;

  /// The registry's entries that are paired and not archived.
  std::vector<PairedDeviceEntry> _activePairedWatches() const;

 private:
  std::optional<std::string> localSerialNumber() const;
  KVRDevices overriddenWatches(const Value& serialNumbers) const;

  Platform& platform_;
};

}  // namespace kvr
