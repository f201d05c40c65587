#include "core/agent/StartUp.h"

#include "core/agent/Activities.h"
#include "core/agent/Configuration.h"
#include "core/followup/FollowUpKeys.h"
#include "core/followup/KVRFollowUp.h"
#include "core/followup/KVRFollowUpRefresh.h"
#include "core/warranty/WarrantyKeys.h"
#include "platform/names/Names.h"

namespace kvr {

void StartUp::announce(Log& log) { log.standard("launched"); }

StartUp::StartUp(Platform& platform) : delegate_(platform) {
  kvr_registerDefaults(platform.preferences);
  registerActivities(platform);
  platform.activities.suspend();
  monitor(platform, names::kPostUpgrade);
  monitor(platform, names::kPostBoot);
  monitor(platform, names::kOutreach);
  monitor(platform, names::kConversionOutreach);
  monitor(platform, names::kFollowUpRefresh);
  agent_ = KVRAgent::initWithCallingProcessBundleID(platform, kPreferencesBundleID);
  agent_->performMigrationIfNeeded();
  resumePosts(platform);
  resumeRefreshes(platform);
  const auto deviceInfos = deviceInfosQueryOf(agent_, platform.log);
  localeMonitor_ = KVRLocaleMonitor::initWithAgent(platform, deviceInfos);
  localeMonitor_->start();
  pairedDevicesMonitor_ = KVRPairedDevicesMonitor::initWithAgent(platform, deviceInfos);
  pairedDevicesMonitor_->start();
  listener_ = platform.services.newListener(names::kAgent);
  listener_->setDelegate(delegate_);
  listener_->resume(agentServiceInterface());
  platform.activities.resume();
}

/// Checks in for the follow-up post activity if an earlier start of the process scheduled it; otherwise its
/// follow-ups would be lost. Unlike the other activities, it exists only while it is scheduled.
void StartUp::resumePosts(Platform& platform) {
  const auto post = KVRScheduler::newSchedulerForActivity(platform, names::kFollowUpPost);
  if (post->scheduledActivityDate()) post->monitorForScheduledActivity();
}

/// Schedules a refresh if follow-ups are shown and none is scheduled: an earlier start may have been killed
/// before it scheduled one. The refresh normally runs at once. If no posting is recorded (the follow-up was
/// migrated, or the preferences were lost), it gets the date that it would get after a posting: the cached
/// warranty may be invalid until the next download, and a refresh at once would remove the follow-up.
void StartUp::resumeRefreshes(Platform& platform) {
  const auto refresh = KVRScheduler::newSchedulerForActivity(platform, names::kFollowUpRefresh);
  if (refresh->scheduledActivityDate() || KVRFollowUp(platform).pendingFollowUpCount() == 0) return;
  Date date = platform.clock.now();
  if (platform.preferences.objectForKey(preference::kFollowUpPostedHashes).isNull()) {
    const auto device = agent_->deviceProvider()->defaultDevice();
    const auto warranty = KVRWarranty::cachedWarrantyForSerialNumber(platform, device->serialNumber());
    date = KVRFollowUpRefresh::_refreshDateWithDevicesInfo(
        platform, {KVRDeviceInfo::deviceInfoWithDevice(device, warranty)});
  }
  refresh->scheduleActivityForDate(date, RegistrationCause::Demand);
}

void StartUp::monitor(Platform& platform, const char* activity) {
  auto scheduler = KVRScheduler::newSchedulerForActivity(platform, activity);
  scheduler->monitorForScheduledActivity();
  schedulers_.push_back(std::move(scheduler));
}

}  // namespace kvr
