#pragma once

#include "local/device/DeviceRoot.h"
#include "platform/services/UserLocale.h"

#include <mutex>
#include <optional>
#include <string>

namespace kvr {

/// The locale from "Locale.plist", or else from the environment (LC_ALL, LC_MESSAGES, LANG); the time zone
/// from the environment (TZ) or the system.
class LocalUserLocale : public UserLocale {
 public:
  LocalUserLocale(const DeviceRoot& root, Log& log) : root_(root), log_(log) {}

  std::string preferredIdentifier() const override;
  /// Whether "Locale.plist" names the locale.
  bool isStatedByDevice() const { return statedByDevice().has_value(); }
  long secondsFromGMT(Date date) const override;
  /// Returns plain digits if the locale library cannot be loaded, which is logged once as an error.
  std::string decimalString(std::uint64_t number) const override;

 private:
  std::optional<std::string> statedByDevice() const;

  const DeviceRoot& root_;
  Log& log_;
  mutable std::once_flag loaded_;
  mutable void* decimalString_ = nullptr;
};

}  // namespace kvr
