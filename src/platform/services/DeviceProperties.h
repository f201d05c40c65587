#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace kvr {

/// Facts about the device the agent runs on, read afresh by every call. Any thread.
class DeviceProperties {
 public:
  static constexpr std::string_view kSerialNumber = "SerialNumber";
  static constexpr std::string_view kUserAssignedDeviceName = "UserAssignedDeviceName";
  static constexpr std::string_view kProductType = "ProductType";
  static constexpr std::string_view kProductVersion = "ProductVersion";

  virtual ~DeviceProperties() = default;
  /// The answer to one of the questions above, or nothing.
  virtual std::optional<std::string> answer(std::string_view question) const = 0;
  /// Whether this is an internal (engineering) installation of the operating system.
  virtual bool isInternalInstall() const = 0;
};

}  // namespace kvr
