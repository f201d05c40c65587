#pragma once

#include "local/device/DeviceRoot.h"
#include "platform/services/DeviceProperties.h"

namespace kvr {

/// The properties in "DeviceProperties.plist"; those missing there are read from the host system.
class LocalDeviceProperties : public DeviceProperties {
 public:
  /// `systemRoot` is prefixed to the paths of the host system's files.
  explicit LocalDeviceProperties(const DeviceRoot& root, std::string systemRoot = "")
      : root_(root), systemRoot_(std::move(systemRoot)) {}

  std::optional<std::string> answer(std::string_view question) const override;
  bool isInternalInstall() const override;

 private:
  std::optional<std::string> hostAnswer(std::string_view question) const;
  std::optional<std::string> firstFact(std::initializer_list<const char*> paths) const;
  std::optional<std::string> textOf(const char* path) const;

  const DeviceRoot& root_;
  const std::string systemRoot_;
};

}  // namespace kvr
