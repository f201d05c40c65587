#pragma once

#include "core/warranty/KVRWarranty.h"
#include "platform/services/CarrierInfo.h"
#include "platform/value/Value.h"

#include <optional>
#include <string>

namespace kvr {

/// The country code directly followed by the network code; nothing for a carrier that lacks either.
std::optional<std::string> carrierID(const Carrier& carrier);

/// Whether an offer's list of excluded carriers holds this one.
bool excludesCarrier(const Value& offerToggle, const std::optional<std::string>& carrierID);

/// The post date of an offer's follow-up: the warranty's display date, otherwise the end of eligibility minus
/// the warranty's lead time; nothing if both dates are missing.
std::optional<Date> outreachPostDate(const KVRWarranty& warranty);

/// The earlier of two post dates: `held` if they are equal, `candidate` if nothing is held. A missing
/// candidate counts as `now`; if that is earlier than `held`, the result is nothing.
std::optional<Date> earlierPostDate(std::optional<Date> held, std::optional<Date> candidate, Date now);

}  // namespace kvr
