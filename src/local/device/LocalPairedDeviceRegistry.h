#pragma once

#include "local/device/DeviceRoot.h"
#include "platform/services/PairedDeviceRegistry.h"

namespace kvr {

/// The watches of "PairedDevices.plist".
class LocalPairedDeviceRegistry : public PairedDeviceRegistry {
 public:
  explicit LocalPairedDeviceRegistry(const DeviceRoot& root) : root_(root) {}

  std::vector<PairedDeviceEntry> allDevicesPassing(const Predicate& predicate) const override;

 private:
  const DeviceRoot& root_;
};

}  // namespace kvr
