#pragma once

#include "platform/services/CarrierInfo.h"
#include "platform/value/Date.h"
#include "platform/value/Value.h"

#include <optional>
#include <string>

namespace kvr {

/// The country code directly followed by the network code; nothing for a carrier that lacks either.
std::optional<std::string> carrierID(const Carrier& carrier);

/// Whether an offer's list of excluded carriers holds this one.
bool excludesCarrier(const Value& offerToggle, const std::optional<std::string>& carrierID);

/// The earlier of two post dates: `held` if they are equal, `candidate` if nothing is held. A missing
/// candidate counts as `now`; if that is earlier than `held`, the result is nothing.
std::optional<Date> earlierPostDate(std::optional<Date> held, std::optional<Date> candidate, Date now);

}  // namespace kvr
