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

/// When an offer's follow-up is to be posted: the warranty's own display date, else so long before the
/// eligibility ends as it says; nothing without either.
std::optional<Date> outreachPostDate(const KVRWarranty& warranty);

/// The earlier of two post dates, the held one when they are equal. Nothing held: the candidate. A missing
/// candidate counts as `now`; when it wins, nothing is held any more.
std::optional<Date> earlierPostDate(std::optional<Date> held, std::optional<Date> candidate, Date now);

}  // namespace kvr
