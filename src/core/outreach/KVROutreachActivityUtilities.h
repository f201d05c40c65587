#pragma once

#include "core/scheduling/KVRSchedulerActivityDelegate.h"
#include "core/scheduling/RunAnswer.h"
#include "core/warranty/KVRWarranty.h"
#include "platform/Platform.h"
#include "platform/value/AtomicProperty.h"

#include <atomic>
#include <memory>
#include <mutex>
#include <optional>
#include <string>

namespace kvr {

/// One outreach run: downloads every device's warranty, finds the earliest date at which a follow-up is to be
/// posted, and schedules the follow-up post activity for it.
///
/// A device counts when its download succeeds, its warranty shows an offer and none of the phone's carriers
/// is excluded from it. A run finishes even if something fails. Make one for each run; the run keeps it
/// alive.
class KVROutreachActivityUtilities : public std::enable_shared_from_this<KVROutreachActivityUtilities> {
 public:
  explicit KVROutreachActivityUtilities(Platform& platform) : platform_(platform) {}

  /// Returns at once; answers on a background queue. `conversion` shows in the log lines only.
  void performOutreachActivityForConversion(bool conversion,
                                            const std::shared_ptr<KVRScheduler>& withScheduler,
                                            const ActivityHandler& andCompletion);
  /// False when one of this device's carriers is excluded from the offer.
  bool currentDeviceShouldReceiveOutreachForWarranty(const KVRWarranty& warranty) const;

  /// Checks, very rarely, whether the platform asks to defer the run.
  AtomicProperty<std::shared_ptr<Timer>> outReachTimer;
  std::atomic<bool> outreachInProgress{false};

 private:
  void stopDeferCheck();
  void defer(bool conversion, RunAnswer& answer);
  void handleDownload(const std::optional<std::string>& serialNumber, bool success,
                      const KVRWarrantyRef& warranty, bool conversion);
  void finish(bool conversion, RunAnswer& answer);

  Platform& platform_;
  WorkGroup downloads_;
  std::mutex mutex_;  ///< guards the members below
  std::optional<Date> earliestPostDate_;
};

}  // namespace kvr
