#include "core/followup/KVRFollowUpRefresh.h"

#include "core/followup/DeviceFacts.h"
#include "core/followup/FollowUpKeys.h"
#include "core/followup/KVRFollowUp.h"
#include "core/scheduling/KVRScheduler.h"
#include "core/warranty/LookupPolicy.h"
#include "core/warranty/WarrantyKeys.h"
#include "platform/names/Names.h"

#include <algorithm>
#include <vector>

namespace kvr {

std::string KVRFollowUpRefresh::identifier() const { return names::kFollowUpRefresh; }

void KVRFollowUpRefresh::performActivityForScheduler(const std::shared_ptr<KVRScheduler>& /*scheduler*/,
                                                     ActivityHandler withCompletionHandler) {
  deviceInfosQuery_(
      LookupPolicy::kCacheOnly, false,
      DeviceInfosAnswer(
          platform_.log, "KVRFollowUpRefresh",
          [self = shared_from_this(), withCompletionHandler](const std::optional<KVRDeviceInfoList>& list) {
            if (list) {
              self->refreshAndSchedule(*list);
              withCompletionHandler(ActivityResult::Finished);
            } else {
              self->platform_.log.standard("Unable to load device info for followup refresh, defer");
              withCompletionHandler(ActivityResult::Deferred);
            }
          }));
}

void KVRFollowUpRefresh::refreshAndSchedule(const KVRDeviceInfoList& devicesInfo) {
  auto& log = platform_.log;
  const double day = platform_.preferences.doubleForKey(preference::kOneDayInterval);
  // Taken before the texts are written: a count that drops meanwhile is still to be shown.
  const auto now = platform_.clock.now();
  const auto facts = dateFactsOf(platform_, devicesInfo);
  const auto shown = KVRFollowUp(platform_).refreshFollowupWithDeviceInfos(devicesInfo);
  if (shown.empty()) {
    log.standard("No followups present, don't schedule another refresh");
    return;
  }
  log.standard("Followup present, schedule refresh for %@", shown);
  std::vector<FollowUpDateFacts> shownFacts;
  for (std::size_t i = 0; i < devicesInfo.size(); ++i) {
    if (std::ranges::find(shown, devicesInfo[i]) != shown.end()) shownFacts.push_back(facts[i]);
  }
  const auto next = refreshDate(shownFacts, now, day);
  const auto date = followingRefreshDate(next, now, day);
  if (date != next) log.standard("Next refresh for %@ would come too soon, put off", next);
  log.standard("Schedule next refresh for %@", date);
  // A date that comes from the calendar is not throttled, however soon it is.
  KVRScheduler::newSchedulerWithActivityDelegate(platform_, shared_from_this())
      ->scheduleActivityForDate(date, date == next ? RegistrationCause::Demand : RegistrationCause::Reaction);
}

std::optional<Date> KVRFollowUpRefresh::nextFollowUpRefreshDateWithDevicesInfo(
    Platform& platform, const KVRDeviceInfoList& devicesInfo, bool isInitialCall) {
  return nextRefreshDate(dateFactsOf(platform, devicesInfo), platform.clock.now(),
                         platform.preferences.doubleForKey(preference::kOneDayInterval), isInitialCall);
}

Date KVRFollowUpRefresh::_refreshDateWithDevicesInfo(Platform& platform,
                                                     const KVRDeviceInfoList& devicesInfo) {
  return refreshDate(dateFactsOf(platform, devicesInfo), platform.clock.now(),
                     platform.preferences.doubleForKey(preference::kOneDayInterval));
}

}  // namespace kvr
