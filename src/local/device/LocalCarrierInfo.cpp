#include "local/device/LocalCarrierInfo.h"

namespace kvr {

std::map<std::string, Carrier> LocalCarrierInfo::subscriptions() const {
  std::map<std::string, Carrier> subscriptions;
  const auto carriers = root_.array("Carriers.plist");
  if (!carriers.isArray()) return subscriptions;
  for (std::size_t index = 0; index < carriers.array().size(); ++index) {
    const Value& carrier = carriers.array()[index];
    if (!carrier.isDictionary()) continue;
    subscriptions.emplace(std::to_string(index), Carrier{carrier["mobileCountryCode"].stringIfAny(),
                                                         carrier["mobileNetworkCode"].stringIfAny()});
  }
  return subscriptions;
}

}  // namespace kvr
