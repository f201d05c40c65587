#pragma once

#include <optional>
#include <string>

namespace kvr {

struct ApplicationRecord {
  std::optional<std::string> localizedName;
  std::optional<std::string> vendorName;
};

/// The applications installed on the device. Any thread.
class ApplicationRegistry {
 public:
  virtual ~ApplicationRegistry() = default;
  /// Nothing for an application that is not installed.
  virtual std::optional<ApplicationRecord> installedApplication(
      const std::string& bundleIdentifier) const = 0;
};

}  // namespace kvr
