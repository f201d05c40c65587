#include "core/outreach/WarrantyDownloads.h"

#include "core/devices/KVRDevicesManager.h"
#include "core/outreach/ConversionRules.h"
#include "core/scheduling/KVRScheduler.h"
#include "core/scheduling/SchedulingKeys.h"
#include "platform/names/Names.h"

#include <cmath>

namespace kvr {
namespace {

/// The last scheduled conversion date, if it could not be stored. It counts as stored: otherwise the
/// downloads of its own outreach would schedule it again and again for as long as the disk is full. Guarded
/// by the scheduling turn (`KVRScheduler::takeTurn`).
struct UnstoredDate {
  std::optional<Date> date;
};

std::shared_ptr<UnstoredDate> unstoredDate(Platform& platform) {
  return platform.sharedObjects.get<UnstoredDate>([] { return new UnstoredDate; });
}

std::shared_ptr<KVRScheduler> newConversionScheduler(Platform& platform) {
  return KVRScheduler::newSchedulerForActivity(platform, names::kConversionOutreach);
}

/// Whether the date was stored; the file may round fractions of a second.
bool isStored(const std::optional<Date>& stored, Date date) {
  constexpr double kRounding = 0.001;  // seconds
  return stored && std::abs(*stored - date) <= kRounding;
}

/// Stores the date for which the conversion outreach is scheduled, or remembers it if that fails.
void storeScheduledDate(Platform& platform, Date date) {
  constexpr auto kKey = preference::kConversionOutreachScheduledDate;
  platform.preferences.setObject(date, kKey);
  const bool isDone = isStored(platform.preferences.dateForKey(kKey), date);
  unstoredDate(platform)->date = isDone ? std::nullopt : std::optional(date);
}

/// Retries to store a date that could not be stored. If the activity's target date was not stored either, the
/// outreach is scheduled again, but only once the disk accepts the target date.
void makeUpForUnstoredDate(Platform& platform) {
  const auto date = unstoredDate(platform)->date;
  if (!date) return;
  const auto stored = platform.preferences.dateForKey(preference::kConversionOutreachScheduledDate);
  if (stored && *stored <= *date) {
    unstoredDate(platform)->date.reset();
    return;
  }
  const auto scheduler = newConversionScheduler(platform);
  if (!isStored(scheduler->scheduledActivityDate(), *date)) {
    platform.preferences.setObject(*date, scheduler->identifier() + names::kTargetDateSuffix);
    if (!isStored(scheduler->scheduledActivityDate(), *date)) {
      platform.log.standard("conversion outreach %@ is scheduled, which still cannot be stored", *date);
      return;
    }
    scheduler->scheduleActivityForDate(date);
  }
  storeScheduledDate(platform, *date);
}

/// The facts for the decision, valid while the scheduling lock is held.
ConversionFacts conversionFacts(Platform& platform, const KVRWarranty& warranty,
                                const KVRWarrantyRef& cached) {
  ConversionFacts facts;
  facts.date = warranty.zubOfferConversionDate();
  facts.wasCached = cached != nullptr;
  if (cached) facts.cachedDate = cached->zubOfferConversionDate();
  facts.scheduled = platform.preferences.dateForKey(preference::kConversionOutreachScheduledDate);
  const auto unstored = unstoredDate(platform)->date;
  if (unstored && (!facts.scheduled || *unstored < *facts.scheduled)) facts.scheduled = unstored;
  return facts;
}

}  // namespace

std::shared_ptr<KVRWarrantyDownloader> newWarrantyDownloader(Platform& platform,
                                                             std::string callingProcessBundleID) {
  return std::make_shared<KVRWarrantyDownloader>(
      platform,
      DownloadCaller{
          std::move(callingProcessBundleID),
          [&platform] { return KVRDevicesManager::sharedManager(platform)->defaultDevice()->serialNumber(); },
          [&platform](const KVRWarrantyRef& warranty, const KVRWarrantyRef& cachedWarranty) {
            return _scheduleConversionOutreachIfRequiredForWarranty(platform, warranty, cachedWarranty);
          }});
}

bool _scheduleConversionOutreachIfRequiredForWarranty(Platform& platform, const KVRWarrantyRef& warranty,
                                                      const KVRWarrantyRef& andCachedWarranty) {
  if (!warranty) return true;
  // Downloads of several devices get here concurrently. The turn makes sure that the earliest date wins.
  const auto turn = KVRScheduler::takeTurn(platform);
  makeUpForUnstoredDate(platform);
  const auto facts = conversionFacts(platform, *warranty, andCachedWarranty);
  switch (conversionScheduling(facts)) {
    case ConversionScheduling::NothingNew:
    case ConversionScheduling::NoDate:
      return true;
    case ConversionScheduling::NotEarlier:
      return facts.date != unstoredDate(platform)->date;
    case ConversionScheduling::Earlier:
      platform.log.standard("Re-scheduling conversion outreach %@", *facts.date);
      break;
    case ConversionScheduling::First:
      platform.log.standard("scheduling conversion outreach %@", *facts.date);
      break;
  }
  newConversionScheduler(platform)->scheduleActivityForDate(facts.date);
  storeScheduledDate(platform, *facts.date);
  return !unstoredDate(platform)->date;
}

}  // namespace kvr
