#pragma once

#include "local/device/DeviceRoot.h"
#include "platform/services/ApplicationRegistry.h"

namespace kvr {

/// The applications listed in "Applications.plist" are the installed ones.
class LocalApplicationRegistry : public ApplicationRegistry {
 public:
  explicit LocalApplicationRegistry(const DeviceRoot& root) : root_(root) {}

  std::optional<ApplicationRecord> installedApplication(const std::string& bundleIdentifier) const override {
    const auto applications = root_.dictionary("Applications.plist");
    const Value& record = applications[bundleIdentifier];
    if (!record.isDictionary()) return std::nullopt;
    return ApplicationRecord{record["localizedName"].stringIfAny(), record["vendorName"].stringIfAny()};
  }

 private:
  const DeviceRoot& root_;
};

}  // namespace kvr
