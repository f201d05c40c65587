#pragma once

#include "core/scheduling/KVRSchedulerActivityDelegate.h"
#include "platform/Platform.h"

namespace kvr {

/// Runs after the first start and after every upgrade of the operating system. The first run clears all
/// target dates and, if there is a primary cloud account, schedules the first outreach. Every later run
/// schedules a conversion outreach at once if the OS version has gone up since the run before and no outreach
/// is pending.
class KVRPostUpgradeActivity : public KVRSchedulerActivityDelegate {
 public:
  explicit KVRPostUpgradeActivity(Platform& platform) : platform_(platform) {}

  std::string identifier() const override;
  bool requiresNetwork() const override { return false; }
  /// True until the first run is recorded, so also after the preferences were lost.
  bool isOwed() const override;
  void performActivityForScheduler(const std::shared_ptr<KVRScheduler>& scheduler,
                                   ActivityHandler withCompletionHandler) override;

  /// Whether the OS version has gone up (or none is recorded) while no outreach is pending.
  bool shouldTriggerWarrantyDownload() const;

 private:
  void performFirstRun();
  void performLaterRun();
  void recordOSVersion();

  Platform& platform_;
};

}  // namespace kvr
