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

/// The follow-up post activity is no long-lived one: it exists only while it is scheduled. What an earlier
/// start scheduled has to come to its run in this one, or its follow-ups would be lost.
void StartUp::resumePosts(Platform& platform) {
  const auto post = KVRScheduler::newSchedulerForActivity(platform, names::kFollowUpPost);
  if (post->scheduledActivityDate()) post->monitorForScheduledActivity();
}

/// What is shown has to have a refresh to come, which an earlier start may have died before scheduling. A
/// follow-up of which no posting is known (it was migrated, or the preferences have been lost) has it as
/// after its posting: what is cached of it may not be valid until it has been downloaded anew, and a refresh
/// at once would take it away.
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
