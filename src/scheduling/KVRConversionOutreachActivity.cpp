#include "scheduling/KVRConversionOutreachActivity.h"

#include "scheduling/KVROutreachActivityUtilities.h"
#include "scheduling/KVRScheduler.h"
#include "scheduling/SchedulingKeys.h"

namespace kvr {

std::string KVRConversionOutreachActivity::identifier() const { return activity::kConversionOutreach; }

void KVRConversionOutreachActivity::performActivityForScheduler(
    const std::shared_ptr<KVRScheduler>& scheduler, ActivityHandler withCompletionHandler) {
  platform_.log.standard(
      "%s: for conversion outreach",
      "-[KVRConversionOutreachActivity performActivityForScheduler:withCompletionHandler:]");
  std::make_shared<KVROutreachActivityUtilities>(platform_)->performOutreachActivityForConversion(
      true, scheduler, withCompletionHandler);
}

}  // namespace kvr
