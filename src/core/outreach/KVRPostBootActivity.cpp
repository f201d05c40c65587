#include "core/outreach/KVRPostBootActivity.h"

#include "core/scheduling/KVRScheduler.h"
#include "core/scheduling/SchedulingKeys.h"
#include "platform/names/Names.h"

namespace kvr {

std::string KVRPostBootActivity::identifier() const { return names::kPostBoot; }

void KVRPostBootActivity::performActivityForScheduler(const std::shared_ptr<KVRScheduler>& /*scheduler*/,
                                                      ActivityHandler withCompletionHandler) {
  if (platform_.preferences.boolForKey(preference::kPostUpgradeActivityCompleted)) {
    const auto turn = KVRScheduler::takeTurn(platform_);
    registerAgain(names::kOutreach);
    if (const auto date = registerAgain(names::kConversionOutreach)) {
      platform_.preferences.setObject(*date, preference::kConversionOutreachScheduledDate);
    }
    registerAgain(names::kFollowUpRefresh);
  } else {
    platform_.log.standard("post upgrade activity hasn't yet been performed, skip boot activity");
  }
  withCompletionHandler(ActivityResult::Finished);
}

std::optional<Date> KVRPostBootActivity::registerAgain(const char* identifier) {
  const auto scheduler = KVRScheduler::newSchedulerForActivity(platform_, identifier);
  const auto date = scheduler->scheduledActivityDate();
  if (!date) return std::nullopt;
  platform_.log.standard("'%@' not complete, rescheduling", scheduler->identifier());
  scheduler->scheduleActivityForDate(date, RegistrationCause::Demand);
  return date;
}

}  // namespace kvr
