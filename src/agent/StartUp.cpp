#include "agent/StartUp.h"

#include "agent/AgentKeys.h"
#include "agent/Configuration.h"
#include "followup/FollowUpKeys.h"
#include "followup/KVRFollowUp.h"
#include "followup/KVRFollowUpPost.h"
#include "followup/KVRFollowUpRefresh.h"
#include "scheduling/KVRConversionOutreachActivity.h"
#include "scheduling/KVROutreachActivity.h"
#include "scheduling/KVRPostBootActivity.h"
#include "scheduling/KVRPostUpgradeActivity.h"

namespace kvr {

void StartUp::announce(Log& log) { log.standard("launched"); }

StartUp::StartUp(Platform& platform) : delegate_(platform) {
  kvr_registerDefaults(platform.preferences);
  platform.activities.suspend();
  monitor(platform, std::make_shared<KVRPostUpgradeActivity>(platform));
  monitor(platform, std::make_shared<KVRPostBootActivity>(platform));
  monitor(platform, std::make_shared<KVROutreachActivity>(platform));
  monitor(platform, std::make_shared<KVRConversionOutreachActivity>(platform));
  monitor(platform, std::make_shared<KVRFollowUpRefresh>(platform));
  agent_ = KVRAgent::initWithCallingProcessBundleID(platform, kPreferencesBundleID);
  agent_->performMigrationIfNeeded();
  resumePosts(platform);
  resumeRefreshes(platform);
  localeMonitor_ = KVRLocaleMonitor::initWithAgent(platform, agent_);
  localeMonitor_->start();
  pairedDevicesMonitor_ = KVRPairedDevicesMonitor::initWithAgent(platform, agent_);
  pairedDevicesMonitor_->start();
  listener_ = platform.services.newListener(kServiceName);
  listener_->setDelegate(delegate_);
  listener_->resume(agentServiceInterface());
  platform.activities.resume();
}

/// The follow-up post activity is no long-lived one: it exists only while it is scheduled. What an earlier
/// start scheduled has to come to its run in this one, or its follow-ups would be lost.
void StartUp::resumePosts(Platform& platform) {
  const auto post =
      KVRScheduler::newSchedulerWithActivityDelegate(platform, std::make_shared<KVRFollowUpPost>(platform));
  if (post->scheduledActivityDate()) post->monitorForScheduledActivity();
}

/// What is shown has to have a refresh to come, which an earlier start may have died before scheduling. A
/// follow-up of which no posting is known (it was migrated, or the preferences have been lost) has it as
/// after its posting: what is cached of it may not be valid until it has been downloaded anew, and a refresh
/// at once would take it away.
void StartUp::resumeRefreshes(Platform& platform) {
  const auto refresh = KVRScheduler::newSchedulerWithActivityDelegate(
      platform, std::make_shared<KVRFollowUpRefresh>(platform));
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

void StartUp::monitor(Platform& platform, const std::shared_ptr<KVRSchedulerActivityDelegate>& activity) {
  auto scheduler = KVRScheduler::newSchedulerWithActivityDelegate(platform, activity);
  scheduler->monitorForScheduledActivity();
  schedulers_.push_back(std::move(scheduler));
}

}  // namespace kvr
