#pragma once

#include "platform/value/Date.h"

#include <optional>

namespace kvr {

/// What is known when a warranty has been downloaded.
struct ConversionFacts {
  std::optional<Date> date;        ///< its conversion date
  bool wasCached = false;          ///< whether a warranty of the device was cached before
  std::optional<Date> cachedDate;  ///< that one's conversion date
  std::optional<Date> scheduled;   ///< for when the conversion outreach was scheduled last
};

/// What becomes of the conversion outreach.
enum class ConversionScheduling {
  NothingNew,  ///< the date was known before, or cannot be compared with what was
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
