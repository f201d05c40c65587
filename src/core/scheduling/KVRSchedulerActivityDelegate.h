#pragma once

#include "platform/services/ActivityScheduler.h"

#include <memory>
#include <string>

namespace kvr {

class KVRScheduler;

/// The work of one named activity.
class KVRSchedulerActivityDelegate {
 public:
  virtual ~KVRSchedulerActivityDelegate() = default;
  /// The activity's name, also the prefix of its target-date key.
  virtual std::string identifier() const = 0;
  /// Whether the activity may run only while the network is reachable.
  virtual bool requiresNetwork() const = 0;
  /// Whether a run that should have happened is missing from the records. See `ActivityCheckIn::isOwed`.
  virtual bool isOwed() const { return false; }
  /// One run. Called on a thread of the platform's choosing; the handler is answered once, on any thread.
  virtual void performActivityForScheduler(const std::shared_ptr<KVRScheduler>& scheduler,
                                           ActivityHandler withCompletionHandler) = 0;
};

}  // namespace kvr
