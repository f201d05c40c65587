#pragma once

#include "local/device/DeviceRoot.h"
#include "platform/services/FeatureFlags.h"

namespace kvr {

/// The switches of "FeatureFlags.plist".
class LocalFeatureFlags : public FeatureFlags {
 public:
  explicit LocalFeatureFlags(const DeviceRoot& root) : root_(root) {}

  bool isEnabled(std::string_view domain, std::string_view feature) const override;

 private:
  const DeviceRoot& root_;
};

}  // namespace kvr
