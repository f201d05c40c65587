#include "core/outreach/OutreachRules.h"

#include <algorithm>

namespace kvr {

std::optional<std::string> carrierID(const Carrier& carrier) {
  if (!carrier.mobileCountryCode || !carrier.mobileNetworkCode) return std::nullopt;
  return *carrier.mobileCountryCode + *carrier.mobileNetworkCode;
}

bool excludesCarrier(const Value& offerToggle, const std::optional<std::string>& carrierID) {
  if (!carrierID || !offerToggle.isArray()) return false;
  const auto& carriers = offerToggle.array();
  return std::find(carriers.begin(), carriers.end(), Value(*carrierID)) != carriers.end();
}

std::optional<Date> earlierPostDate(std::optional<Date> held, std::optional<Date> candidate, Date now) {
  if (!held) return candidate;
  return candidate.value_or(now) < *held ? candidate : held;
}

}  // namespace kvr
