#include "scheduling/KVROutreachActivity.h"

#include "scheduling/KVROutreachActivityUtilities.h"
#include "scheduling/KVRScheduler.h"
#include "scheduling/SchedulingKeys.h"

namespace kvr {

std::string KVROutreachActivity::identifier() const { return activity::kOutreach; }

void KVROutreachActivity::performActivityForScheduler(const std::shared_ptr<KVRScheduler>& scheduler,
                                                      ActivityHandler withCompletionHandler) {
  platform_.log.standard("%s: for general outreach",
                         "-[KVROutreachActivity performActivityForScheduler:withCompletionHandler:]");
  std::make_shared<KVROutreachActivityUtilities>(platform_)->performOutreachActivityForConversion(
      false, scheduler, withCompletionHandler);
}

}  // namespace kvr
