#include "core/outreach/KVROutreachActivity.h"

#include "core/outreach/KVROutreachActivityUtilities.h"
#include "core/scheduling/KVRScheduler.h"
#include "core/scheduling/SchedulingKeys.h"
#include "platform/names/Names.h"

namespace kvr {

std::string KVROutreachActivity::identifier() const { return names::kOutreach; }

void KVROutreachActivity::performActivityForScheduler(const std::shared_ptr<KVRScheduler>& scheduler,
                                                      ActivityHandler withCompletionHandler) {
  platform_.log.standard("%s: for general outreach",
                         "-[KVROutreachActivity performActivityForScheduler:withCompletionHandler:]");
  std::make_shared<KVROutreachActivityUtilities>(platform_)->performOutreachActivityForConversion(
      false, scheduler, withCompletionHandler);
}

}  // namespace kvr
