#pragma once

#include "core/scheduling/KVRSchedulerActivityDelegate.h"
#include "platform/Platform.h"

namespace kvr {

/// Outreach for all devices: scheduled after the first start, and whenever a client asks for it.
class KVROutreachActivity : public KVRSchedulerActivityDelegate {
 public:
  explicit KVROutreachActivity(Platform& platform) : platform_(platform) {}

  std::string identifier() const override;
  bool requiresNetwork() const override { return true; }
  void performActivityForScheduler(const std::shared_ptr<KVRScheduler>& scheduler,
                                   ActivityHandler withCompletionHandler) override;

 private:
  Platform& platform_;
};

}  // namespace kvr
