#pragma once

#include "kvr-simulate/Dice.h"
#include "platform/value/Date.h"
#include "platform/value/Value.h"

#include <optional>

namespace kvr::simulate {

/// A date between `leastDays` and `mostDays` from `today`, as the service sends it: mostly in whole seconds,
/// sometimes with a fraction, in milliseconds, negative, or any other number.
Value drawEpoch(Dice& dice, Date today, double leastDays, double mostDays);

// What the values from the service mean. Implemented independently of the agent, as a second opinion.

/// Whole unsigned seconds, or milliseconds above ten thousand million. The bits of a negative number are read
/// as unsigned, so it lies in the far future.
std::optional<Date> dateOf(const Value& epoch);
/// The conversion date in a warranty; `day` is the length of a day in seconds.
std::optional<Date> conversionDateIn(const Value& warranty, double day);

}  // namespace kvr::simulate
