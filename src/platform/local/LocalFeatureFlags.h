#pragma once

#include "platform/FeatureFlags.h"
#include "platform/local/DeviceRoot.h"

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
