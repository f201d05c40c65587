#pragma once

#include "core/devices/KVRDevice.h"
#include "core/warranty/KVRWarranty.h"

#include <memory>
#include <string>
#include <vector>

namespace kvr {

class KVRDeviceInfo;
using KVRDeviceInfoRef = std::shared_ptr<const KVRDeviceInfo>;
using KVRDeviceInfoList = std::vector<KVRDeviceInfoRef>;

/// A device together with its warranty, if one is known. Any thread.
class KVRDeviceInfo {
 public:
  KVRDeviceInfo(KVRDeviceRef device, KVRWarrantyRef warranty);
  static std::shared_ptr<KVRDeviceInfo> deviceInfoWithDevice(KVRDeviceRef device, KVRWarrantyRef warranty);

  static constexpr bool supportsSecureCoding() { return true; }
  static std::shared_ptr<KVRDeviceInfo> initWithCoder(Platform& platform, const Value& coded);
  Value encodeWithCoder() const;

  /// The same device object and an equal warranty; a record without device or warranty equals no other.
  bool isEqual(const KVRDeviceInfo& other) const;
  std::string description() const;

  AtomicProperty<KVRDeviceRef> device;
  AtomicProperty<KVRWarrantyRef> warranty;
};

}  // namespace kvr
