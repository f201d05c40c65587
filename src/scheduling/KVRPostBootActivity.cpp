#include "scheduling/KVRPostBootActivity.h"

#include "agent/AgentKeys.h"
#include "followup/KVRFollowUpRefresh.h"
#include "scheduling/KVRConversionOutreachActivity.h"
#include "scheduling/KVROutreachActivity.h"
#include "scheduling/KVRScheduler.h"
#include "scheduling/SchedulingKeys.h"

namespace kvr {

std::string KVRPostBootActivity::identifier() const { return activity::kPostBoot; }

void KVRPostBootActivity::performActivityForScheduler(const std::shared_ptr<KVRScheduler>& /*scheduler*/,
                                                      ActivityHandler withCompletionHandler) {
  if (platform_.preferences.boolForKey(preference::kPostUpgradeActivityCompleted)) {
    const auto turn = KVRScheduler::takeTurn(platform_);
    registerAgain(std::make_shared<KVROutreachActivity>(platform_));
    if (const auto date = registerAgain(std::make_shared<KVRConversionOutreachActivity>(platform_))) {
      platform_.preferences.setObject(*date, preference::kConversionOutreachScheduledDate);
    }
    registerAgain(std::make_shared<KVRFollowUpRefresh>(platform_));
  } else {
    platform_.log.standard("post upgrade activity hasn't yet been performed, skip boot activity");
  }
  withCompletionHandler(ActivityResult::Finished);
}

std::optional<Date> KVRPostBootActivity::registerAgain(
    const std::shared_ptr<KVRSchedulerActivityDelegate>& activity) {
  const auto scheduler = KVRScheduler::newSchedulerWithActivityDelegate(platform_, activity);
  const auto date = scheduler->scheduledActivityDate();
  if (!date) return std::nullopt;
  platform_.log.standard("'%@' not complete, rescheduling", scheduler->identifier());
  scheduler->scheduleActivityForDate(date, RegistrationCause::Demand);
  return date;
}

}  // namespace kvr
