#pragma once

#include <map>
#include <optional>
#include <string>

namespace kvr {

struct Carrier {
  std::optional<std::string> mobileCountryCode;
  std::optional<std::string> mobileNetworkCode;
};

inline std::string describe(const Carrier& carrier) {
  return carrier.mobileCountryCode.value_or("(null)") + "/" + carrier.mobileNetworkCode.value_or("(null)");
}

/// The device's cellular subscriptions. Any thread.
class CarrierInfo {
 public:
  virtual ~CarrierInfo() = default;
  /// Carriers by subscription; empty without a subscription.
  virtual std::map<std::string, Carrier> subscriptions() const = 0;
};

}  // namespace kvr
