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

StartUp::StartUp(Platform& platform) : delegate_(platform) {
  platform.log.standard("launched");
  kvr_registerDefaults(platform.preferences);
  monitor(platform, std::make_shared<KVRPostUpgradeActivity>(platform));
  monitor(platform, std::make_shared<KVRPostBootActivity>(platform));
  monitor(platform, std::make_shared<KVROutreachActivity>(platform));
  monitor(platform, std::make_shared<KVRConversionOutreachActivity>(platform));
  monitor(platform, std::make_shared<KVRFollowUpRefresh>(platform));
  agent_ = KVRAgent::initWithCallingProcessBundleID(platform, kPreferencesBundleID);
  agent_->performMigrationIfNeeded();
  resumeFollowUps(platform);
  localeMonitor_ = KVRLocaleMonitor::initWithAgent(platform, agent_);
  localeMonitor_->start();
  pairedDevicesMonitor_ = KVRPairedDevicesMonitor::initWithAgent(platform, agent_);
  pairedDevicesMonitor_->start();
  listener_ = platform.services.newListener(kServiceName);
  listener_->setDelegate(delegate_);
  listener_->resume(agentServiceInterface());
}

/// The follow-up post activity is no long-lived one: it exists only while it is scheduled. What an earlier
/// start scheduled has to come to its run in this one, or its follow-ups would be lost; and what was posted
/// and is shown has to have a refresh to come, which an earlier start may have died before scheduling.
void StartUp::resumeFollowUps(Platform& platform) {
  const auto post =
      KVRScheduler::newSchedulerWithActivityDelegate(platform, std::make_shared<KVRFollowUpPost>(platform));
  if (post->scheduledActivityDate()) post->monitorForScheduledActivity();
  const auto refresh = KVRScheduler::newSchedulerWithActivityDelegate(
      platform, std::make_shared<KVRFollowUpRefresh>(platform));
  const bool hasPosted = !platform.preferences.objectForKey(preference::kFollowUpPostedHashes).isNull();
  if (hasPosted && !refresh->scheduledActivityDate() && KVRFollowUp(platform).pendingFollowUpCount() > 0) {
    refresh->scheduleActivityForDate(platform.clock.now());
  }
}

void StartUp::monitor(Platform& platform, const std::shared_ptr<KVRSchedulerActivityDelegate>& activity) {
  auto scheduler = KVRScheduler::newSchedulerWithActivityDelegate(platform, activity);
  scheduler->monitorForScheduledActivity();
  schedulers_.push_back(std::move(scheduler));
}

}  // namespace kvr
