#pragma once

#include "core/scheduling/KVRSchedulerActivityDelegate.h"
#include "platform/Platform.h"

namespace kvr {

/// Outreach for all devices when an offer starts again: after an upgrade or at a warranty's conversion date.
class KVRConversionOutreachActivity : public KVRSchedulerActivityDelegate {
 public:
  explicit KVRConversionOutreachActivity(Platform& platform) : platform_(platform) {}

  std::string identifier() const override;
  bool requiresNetwork() const override { return true; }
  void performActivityForScheduler(const std::shared_ptr<KVRScheduler>& scheduler,
                                   ActivityHandler withCompletionHandler) override;

 private:
  Platform& platform_;
};

}  // namespace kvr
