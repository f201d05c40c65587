#include "core/outreach/KVRConversionOutreachActivity.h"

#include "core/outreach/KVROutreachActivityUtilities.h"
#include "core/scheduling/KVRScheduler.h"
#include "core/scheduling/SchedulingKeys.h"
#include "platform/names/Names.h"

namespace kvr {

std::string KVRConversionOutreachActivity::identifier() const { return names::kConversionOutreach; }

void KVRConversionOutreachActivity::performActivityForScheduler(
    const std::shared_ptr<KVRScheduler>& scheduler, ActivityHandler withCompletionHandler) {
  platform_.log.standard(
      "%s: for conversion outreach",
      "-[KVRConversionOutreachActivity performActivityForScheduler:withCompletionHandler:]");
  std::make_shared<KVROutreachActivityUtilities>(platform_)->performOutreachActivityForConversion(
      true, scheduler, withCompletionHandler);
}

}  // namespace kvr
