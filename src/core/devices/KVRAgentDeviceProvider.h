#pragma once

#include "core/devices/KVRDevice.h"

#include <map>
#include <string>

namespace kvr {

/// Devices by their serial numbers.
using KVRDevices = std::map<std::string, KVRDeviceRef>;

/// Provides the devices that an agent serves. Any thread.
class KVRAgentDeviceProvider {
 public:
  virtual ~KVRAgentDeviceProvider() = default;
  /// The local device.
  virtual KVRDeviceRef defaultDevice() = 0;
  virtual KVRDevices pairedDevices() = 0;
  /// The local device (when it has a serial number) and the paired ones.
  virtual KVRDevices allDevices() = 0;
};

}  // namespace kvr
