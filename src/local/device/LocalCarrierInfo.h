#pragma once

#include "local/device/DeviceRoot.h"
#include "platform/services/CarrierInfo.h"

namespace kvr {

/// The subscriptions in "Carriers.plist"; the key of each is its index in the file, as text.
class LocalCarrierInfo : public CarrierInfo {
 public:
  explicit LocalCarrierInfo(const DeviceRoot& root) : root_(root) {}

  std::map<std::string, Carrier> subscriptions() const override;

 private:
  const DeviceRoot& root_;
};

}  // namespace kvr
