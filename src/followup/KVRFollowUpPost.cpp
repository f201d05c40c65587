#include "followup/KVRFollowUpPost.h"

#include "agent/LookupPolicy.h"
#include "followup/DeviceFacts.h"
#include "followup/FollowUpKeys.h"
#include "followup/KVRFollowUp.h"
#include "followup/KVRFollowUpRefresh.h"
#include "scheduling/KVRScheduler.h"
#include "warranty/WarrantyKeys.h"

namespace kvr {
namespace {

constexpr const char* kPerform = "-[KVRFollowUpPost performActivityForScheduler:withCompletionHandler:]";
constexpr double kDeferCheckInterval = 2'000'000'000;  // seconds

}  // namespace

/// One run's answer. A run that was deferred while it waited for its devices still does its work when they
/// come; the answer that it then has is dropped.
class KVRFollowUpPost::Run {
 public:
  Run(Log& log, ActivityHandler handler) : log_(log), handler_(std::move(handler)) {}

  void answer(ActivityResult result) {
    if (answered_.exchange(true)) {
      log_.debug("FollowUp Post activity was answered already, result %d dropped",
                 static_cast<std::int64_t>(result));
      return;
    }
    handler_(result);
  }

 private:
  Log& log_;
  const ActivityHandler handler_;
  std::atomic<bool> answered_{false};
};

std::string KVRFollowUpPost::identifier() const { return activity::kFollowUpPost; }

void KVRFollowUpPost::performActivityForScheduler(const std::shared_ptr<KVRScheduler>& scheduler,
                                                  ActivityHandler withCompletionHandler) {
  followUpPostInProgress = true;
  const auto run = std::make_shared<Run>(platform_.log, std::move(withCompletionHandler));
  startDeferCheck(run, scheduler);
  deviceInfosQuery_(LookupPolicy::kRefresh,
                    DeviceInfosAnswer(platform_.log, "KVRFollowUpPost",
                                      [self = shared_from_this(), run,
                                       scheduler](const std::optional<KVRDeviceInfoList>& list) {
                                        if (scheduler->isEnding()) return self->defer(*run);
                                        self->handle(list, *run);
                                      }));
}

void KVRFollowUpPost::startDeferCheck(const std::shared_ptr<Run>& run,
                                      const std::shared_ptr<KVRScheduler>& scheduler) {
  followUpPostTimer = platform_.queues.newRepeatingTimer(
      kDeferCheckInterval, platform_.queues.mainQueue(), [activity = weak_from_this(), run, scheduler] {
        const auto self = activity.lock();
        if (self && self->followUpPostInProgress && scheduler->shouldDefer()) self->defer(*run);
      });
}

void KVRFollowUpPost::defer(Run& run) {
  platform_.log.standard("FollowUp Post activity deferred.");
  stopDeferCheck();
  run.answer(ActivityResult::Deferred);
}

void KVRFollowUpPost::stopDeferCheck() {
  if (const auto timer = followUpPostTimer()) timer->invalidate();
  followUpPostTimer = nullptr;
}

void KVRFollowUpPost::handle(const std::optional<KVRDeviceInfoList>& devicesInfo, Run& run) {
  platform_.log.standard("%s -> %@", kPerform, devicesInfo);
  if (devicesInfo) {
    postAndSchedule(*devicesInfo);
  } else {
    platform_.log.standard("Unable to load devices info, defer");
  }
  followUpPostInProgress = false;
  stopDeferCheck();
  run.answer(devicesInfo ? ActivityResult::Finished : ActivityResult::Deferred);
}

void KVRFollowUpPost::postAndSchedule(const KVRDeviceInfoList& devicesInfo) {
  const bool hasPosted = KVRFollowUp(platform_).postFollowUpWithDevicesInfo(devicesInfo);
  if (const auto next = nextFollowUpPostDateWithDevicesInfo(platform_, devicesInfo)) {
    const auto date = followingPostDate(*next, platform_.clock.now(),
                                        platform_.preferences.doubleForKey(preference::kOneDayInterval));
    platform_.log.standard("%s: Re-schedule followUp post for: %@", kPerform, date);
    KVRScheduler::newSchedulerWithActivityDelegate(platform_, shared_from_this())
        ->scheduleActivityForDate(date);
  }
  if (hasPosted) {
    const auto date = KVRFollowUpRefresh::_refreshDateWithDevicesInfo(platform_, devicesInfo);
    platform_.log.standard("%s: Schedule refresh for: %@", kPerform, date);
    KVRScheduler::newSchedulerWithActivityDelegate(platform_, std::make_shared<KVRFollowUpRefresh>(platform_))
        ->scheduleActivityForDate(date);
  }
}

std::optional<Date> KVRFollowUpPost::nextFollowUpPostDateWithDevicesInfo(
    Platform& platform, const KVRDeviceInfoList& devicesInfo) {
  return nextPostDate(dateFactsOf(platform, devicesInfo), platform.clock.now());
}

}  // namespace kvr
