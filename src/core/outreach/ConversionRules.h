#pragma once

#include "platform/value/Date.h"

#include <optional>

namespace kvr {

/// The facts about a downloaded warranty that decide on the conversion outreach.
struct ConversionFacts {
  std::optional<Date> date;        ///< its conversion date
  bool wasCached = false;          ///< whether a warranty of the device was cached before
  std::optional<Date> cachedDate;  ///< that one's conversion date
  std::optional<Date> scheduled;   ///< date of the last scheduled conversion outreach
};

/// What to do about the conversion outreach.
enum class ConversionScheduling {
  NothingNew,  ///< the date is the cached one, or one of the two is missing
  NoDate,
  NotEarlier,  ///< the schedule only ever moves earlier
  Earlier,     ///< schedule again, for the earlier date
  First,       ///< schedule
};

/// The first reason that applies, in this order.
constexpr ConversionScheduling conversionScheduling(const ConversionFacts& facts) {
  if (facts.wasCached && (!facts.cachedDate || !facts.date || *facts.cachedDate == *facts.date)) {
    return ConversionScheduling::NothingNew;
  }
  if (!facts.date) return ConversionScheduling::NoDate;
  if (!facts.scheduled) return ConversionScheduling::First;
  return *facts.date < *facts.scheduled ? ConversionScheduling::Earlier : ConversionScheduling::NotEarlier;
}

}  // namespace kvr
