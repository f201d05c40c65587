#include "core/outreach/KVRPostUpgradeActivity.h"

#include "core/devices/DeviceKeys.h"
#include "core/outreach/VersionOrder.h"
#include "core/scheduling/KVRScheduler.h"
#include "core/scheduling/SchedulingKeys.h"
#include "platform/names/Names.h"

namespace kvr {

std::string KVRPostUpgradeActivity::identifier() const { return names::kPostUpgrade; }

bool KVRPostUpgradeActivity::isOwed() const {
  return !platform_.preferences.boolForKey(preference::kPostUpgradeActivityCompleted);
}

void KVRPostUpgradeActivity::performActivityForScheduler(const std::shared_ptr<KVRScheduler>& /*scheduler*/,
                                                         ActivityHandler withCompletionHandler) {
  {
    const auto turn = KVRScheduler::takeTurn(platform_);
    isOwed() ? performFirstRun() : performLaterRun();
  }
  recordOSVersion();
  withCompletionHandler(ActivityResult::Finished);
}

void KVRPostUpgradeActivity::performLaterRun() {
  if (!shouldTriggerWarrantyDownload()) {
    platform_.log.standard("post upgrade activity already performed");
    return;
  }
  platform_.log.standard("Forcing conversion outreach on upgrade");
  KVRScheduler::newSchedulerForActivity(platform_, names::kConversionOutreach)
      ->scheduleActivityForDate(platform_.clock.now(), RegistrationCause::Demand);
}

void KVRPostUpgradeActivity::performFirstRun() {
  auto& preferences = platform_.preferences;
  platform_.log.standard("post upgrade activity hasn't yet been performed, perform upgrade activity");
  const bool hasAccount = platform_.accounts.primaryAccount().has_value();
  KVRScheduler::clearScheduledActivities(platform_);
  preferences.setObject(platform_.clock.now(), preference::kDefaultDeviceActivationDate);
  if (hasAccount) {
    KVRScheduler::newSchedulerForActivity(platform_, names::kOutreach)
        ->scheduleActivityForDate(platform_.clock.now(), RegistrationCause::Demand);
    preferences.setObject(true, preference::kInitialOutreachActivityScheduled);
  } else {
    platform_.log.standard(
        "No primary account detected. Finishing post upgrade activity without scheduling outreach");
  }
  preferences.setObject(true, preference::kPostUpgradeActivityCompleted);
}

void KVRPostUpgradeActivity::recordOSVersion() {
  const auto version = platform_.deviceProperties.answer(DeviceProperties::kProductVersion);
  if (version) {
    platform_.preferences.setObject(*version, preference::kPostUpgradeOSVersion);
  } else {
    platform_.log.error("Unable to get OS version");
  }
}

bool KVRPostUpgradeActivity::shouldTriggerWarrantyDownload() const {
  const auto current = platform_.deviceProperties.answer(DeviceProperties::kProductVersion);
  const auto recorded = platform_.preferences.stringForKey(preference::kPostUpgradeOSVersion);
  if (!current) return false;
  if (recorded && std::is_lteq(compareVersions(*current, *recorded))) return false;
  const auto outreach = KVRScheduler::newSchedulerForActivity(platform_, names::kOutreach);
  return !outreach->scheduledActivityDate();
}

}  // namespace kvr
