// Conversion dates and cached warranties.

#include "core/scheduling/SchedulingKeys.h"
#include "core/warranty/CacheMetadata.h"
#include "core/warranty/WarrantyKeys.h"
#include "kvr-simulate/Epochs.h"
#include "kvr-simulate/Invariants.h"
#include "platform/names/Names.h"
#include "platform/text/SHA256Hash.h"

#include <algorithm>
#include <cmath>

namespace kvr::simulate {
namespace {

constexpr double kHour = 3600;
constexpr double kLongestLookUp = 3 * kHour;
constexpr const char* kCacheSuffix = "_Warranty.plist";

/// Dates in a far future are rounded when they are stored.
double roundingOf(Date date) { return 1e-15 * std::abs(date.secondsSince1970); }

std::string cachePathOf(const std::string& serialNumber) {
  return std::string(SimulatedFiles::kHomeDirectory) + "/Library/Application Support/com.tarsil.Kavrel/" +
         sha256Hash(serialNumber) + kCacheSuffix;
}

}  // namespace

void Invariants::answered(const Value& warranty) {
  for (const double day : kDayLengths) {
    if (const auto date = conversionDateIn(warranty, day)) conversionDates_.insert(*date);
  }
}

/// Conversion dates come from downloads. A run after a boot may store the pending one again.
void Invariants::checkConversionDate(const Value& stored) {
  if (runs_.contains(names::kPostBoot) && stored == conversionAtStart_) return;
  const auto date = stored.dateIfAny();
  const bool isBrought = date && std::ranges::any_of(conversionDates_, [&](Date brought) {
                           return std::abs(brought - *date) <= roundingOf(*date);
                         });
  if (!isBrought) report("a conversion date is the service's", describe(stored));
}

// Cached warranties.

void Invariants::readCaches() {
  caches_.clear();
  for (const auto& path : platform_->files.list("")) {
    if (path.ends_with(kCacheSuffix)) caches_[path].warranty = platform_->files.getPropertyList(path);
  }
}

/// The conversion date in a download is stored before its warranty is cached, unless an earlier one is
/// already stored. Migration, which is part of start-up, stores none.
void Invariants::cacheChanged(const std::string& path) {
  if (!path.ends_with(kCacheSuffix)) return;
  auto& cache = caches_[path];
  cache.earlier = std::exchange(cache.warranty, platform_->files.getPropertyList(path));
  cache.changed = world_.now;
  if (!isWatching() || isStartingUp()) return;
  const auto date = conversionDateOf(cache.warranty);
  const auto before = conversionDateOf(cache.earlier);
  const bool isNews = date && (cache.earlier.isNull() || (before && before != date));
  if (isNews) cache.hasNews = true;
  if (isNews && !filesFail_) checkConversionStored(cache);
}

/// If the date could not be stored, the next download that contains it must store it.
void Invariants::downloaded(const std::string& lastUpdatedKey) {
  const auto hash = lastUpdatedKey.substr(0, lastUpdatedKey.find('_'));
  const auto found = std::ranges::find_if(
      caches_, [&](const auto& cache) { return cache.first.ends_with(hash + kCacheSuffix); });
  if (found != caches_.end() && found->second.hasNews && !filesFail_) checkConversionStored(found->second);
}

void Invariants::checkConversionStored(Cache& cache) {
  cache.hasNews = false;
  const auto date = conversionDateOf(cache.warranty);
  const auto stored = preferences()[preference::kConversionOutreachScheduledDate].dateIfAny();
  if (date && (!stored || *stored - *date > roundingOf(*date))) {
    report("a conversion date that is news is stored",
           describe(*date) + ", stored is " + (stored ? describe(*stored) : std::string("none")));
  }
}

std::optional<Date> Invariants::conversionDateOf(const Value& warranty) const {
  const Value& day = preferences_[preference::kOneDayInterval];
  return conversionDateIn(warranty, day.isNull() ? kDayLengths[0] : day.asDouble());
}

/// Whether every answer that a look-up of this device can have got lately is an open offer.
bool Invariants::isSurelyOpen(const std::string& serialNumber) const {
  const auto now = platform_->clock.now();
  const CacheMetadata metadata(serialNumber);
  const auto found = caches_.find(cachePathOf(serialNumber));
  const bool isCacheValid = found != caches_.end() &&
                            preferences_[metadata.versionKey] == Value(kCacheFormatVersion) &&
                            preferences_[metadata.localeKey] == Value(world_.locale);
  if (!isCacheValid || !world_.service.areOpen(serialNumber, world_.now - kLongestLookUp, now)) return false;
  const auto isOpen = [&](const Value& warranty) {
    const auto* const offer = world_.service.find(warranty["zubLocalizedOfferLabel"]);
    return offer != nullptr && offer->isOpen(now);
  };
  const auto& cache = found->second;
  return isOpen(cache.warranty) && (cache.changed < world_.now - kLongestLookUp || isOpen(cache.earlier));
}

void Invariants::checkCleared(const std::string& serialNumber) {
  const auto tracked = world_.trackedSerialNumbers();
  const bool isExcused = filesFailed_ || world_.now < troubled_ + kLongestLookUp || world_.isInTrouble() ||
                         isWithoutWatches(preferences_[preference::kServerVersionCache]) ||
                         dismissed_.contains(serialNumber) ||
                         std::ranges::find(tracked, serialNumber) == tracked.end();
  if (!isExcused && isSurelyOpen(serialNumber)) report("no open offer is taken away", serialNumber);
}

}  // namespace kvr::simulate
