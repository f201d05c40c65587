#pragma once

#include "platform/value/Date.h"
#include "platform/value/Value.h"

#include <optional>

namespace kvr {

/// Converts a number from the coverage service to a date; nothing for a value that is not a number or bool.
///
/// The number is read as an unsigned 64-bit integer: fractions are dropped, a negative number wraps around to
/// the far future, and a real beyond the range is the nearest integer within it (NaN is 0). Up to
/// 10,000,000,000 it counts seconds since 1970-01-01 00:00 UTC, above that milliseconds, whose remainder is
/// dropped.
std::optional<Date> dateWithEpochNumber(const Value& number);

}  // namespace kvr
