#include "core/followup/KVRFollowUpPost.h"

#include "core/followup/DeviceFacts.h"
#include "core/followup/FollowUpKeys.h"
#include "core/followup/KVRFollowUp.h"
#include "core/scheduling/KVRScheduler.h"
#include "core/warranty/LookupPolicy.h"
#include "core/warranty/WarrantyKeys.h"
#include "platform/names/Names.h"

namespace kvr {
namespace {

constexpr const char* kPerform = "-[KVRFollowUpPost performActivityForScheduler:withCompletionHandler:]";

}  // namespace

std::string KVRFollowUpPost::identifier() const { return names::kFollowUpPost; }

void KVRFollowUpPost::performActivityForScheduler(const std::shared_ptr<KVRScheduler>& scheduler,
                                                  ActivityHandler withCompletionHandler) {
  followUpPostInProgress = true;
  const auto answer = std::make_shared<RunAnswer>(platform_.log, std::move(withCompletionHandler));
  followUpPostTimer = newDeferCheck<KVRFollowUpPost>(platform_.queues, weak_from_this(), answer, scheduler,
                                                     [](KVRFollowUpPost& self, RunAnswer& pending) {
                                                       if (self.followUpPostInProgress) self.defer(pending);
                                                     });
  deviceInfosQuery_(
      LookupPolicy::kRefresh, false,
      DeviceInfosAnswer(platform_.log, "KVRFollowUpPost",
                        [self = shared_from_this(), answer](const std::optional<KVRDeviceInfoList>& list) {
                          if (!self->platform_.cleanExit.isEnding()) return self->handle(list, *answer);
                          self->followUpPostInProgress = false;
                          self->defer(*answer);
                        }));
}

void KVRFollowUpPost::defer(RunAnswer& answer) {
  platform_.log.standard("FollowUp Post activity deferred.");
  stopDeferCheck();
  answer.give(ActivityResult::Deferred);
}

void KVRFollowUpPost::stopDeferCheck() {
  if (const auto timer = followUpPostTimer()) timer->invalidate();
  followUpPostTimer = nullptr;
}

void KVRFollowUpPost::handle(const std::optional<KVRDeviceInfoList>& devicesInfo, RunAnswer& answer) {
  platform_.log.standard("%s -> %@", kPerform, devicesInfo);
  if (devicesInfo) {
    postAndSchedule(*devicesInfo);
  } else {
    platform_.log.standard("Unable to load devices info, defer");
  }
  followUpPostInProgress = false;
  stopDeferCheck();
  answer.give(devicesInfo ? ActivityResult::Finished : ActivityResult::Deferred);
}

void KVRFollowUpPost::postAndSchedule(const KVRDeviceInfoList& devicesInfo) {
  const double day = platform_.preferences.doubleForKey(preference::kOneDayInterval);
  // Taken before posting: what comes due, or counts a day less, meanwhile then still counts as in the future.
  const auto now = platform_.clock.now();
  const auto factsBefore = dateFactsOf(platform_, devicesInfo);
  const bool hasPosted = KVRFollowUp(platform_).postFollowUpWithDevicesInfo(devicesInfo);
  const auto facts = dateFactsOf(platform_, devicesInfo);
  if (const auto next = nextPostDate(facts, now)) {
    const auto date = followingPostDate(*next, facts, now, day);
    platform_.log.standard("%s: Re-schedule followUp post for: %@", kPerform, date);
    KVRScheduler::newSchedulerWithActivityDelegate(platform_, shared_from_this())
        ->scheduleActivityForDate(date);
  }
  if (hasPosted) {
    const auto date = refreshDate(factsBefore, now, day);
    platform_.log.standard("%s: Schedule refresh for: %@", kPerform, date);
    KVRScheduler::newSchedulerForActivity(platform_, names::kFollowUpRefresh)
        ->scheduleActivityForDate(date, RegistrationCause::Demand);
  }
}

std::optional<Date> KVRFollowUpPost::nextFollowUpPostDateWithDevicesInfo(
    Platform& platform, const KVRDeviceInfoList& devicesInfo) {
  return nextPostDate(dateFactsOf(platform, devicesInfo), platform.clock.now());
}

}  // namespace kvr
