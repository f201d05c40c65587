#pragma once

#include "kvr-simulate/Dice.h"
#include "platform/value/Date.h"
#include "platform/value/Value.h"

#include <optional>

namespace kvr::simulate {

/// A date so many days from `today`, as the service sends it: mostly in whole seconds, now and then with a
/// fraction, in milliseconds, below zero, or as anything else that a number can be.
Value drawEpoch(Dice& dice, Date today, double leastDays, double mostDays);

// What the service means by what it sends. Read here anew, so that the agent's reading has a second opinion.

/// Whole seconds without a sign; above ten thousand millions they are milliseconds. A number below zero is
/// what its bits are without a sign, and lies in a far future.
std::optional<Date> dateOf(const Value& epoch);
/// The conversion date that a warranty brings, with days of so many seconds.
std::optional<Date> conversionDateIn(const Value& warranty, double day);

}  // namespace kvr::simulate
