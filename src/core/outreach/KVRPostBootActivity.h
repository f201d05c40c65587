#pragma once

#include "core/scheduling/KVRSchedulerActivityDelegate.h"
#include "platform/Platform.h"

namespace kvr {

/// Runs after every boot. Registers outreach, conversion outreach and follow-up refresh again: each one that
/// has a target date, for that date.
class KVRPostBootActivity : public KVRSchedulerActivityDelegate {
 public:
  explicit KVRPostBootActivity(Platform& platform) : platform_(platform) {}

  std::string identifier() const override;
  bool requiresNetwork() const override { return false; }
  void performActivityForScheduler(const std::shared_ptr<KVRScheduler>& scheduler,
                                   ActivityHandler withCompletionHandler) override;

 private:
  /// The date for which the activity was registered again, if it was.
  std::optional<Date> registerAgain(const char* identifier);

  Platform& platform_;
};

}  // namespace kvr
