#pragma once

#include "platform/Platform.h"
#include "platform/log/Completion.h"
#include "platform/value/Value.h"

#include <string>

namespace kvr {

/// The availability dictionary, or null if the store could not be asked.
using AvailabilityReply = Completion<Value>;

/// Finds out the state of the maker's support application on this device: installed, bought earlier,
/// available in the store, or none of these. The answer is a dictionary with the keys of `availability`.
///
/// Make one for each request; it has no state.
class KVRTarsilSupportManager {
 public:
  explicit KVRTarsilSupportManager(Platform& platform) : platform_(platform) {}

  /// The full answer; it always names the bundle, and no more than that when the store could not be asked.
  /// May block for as long as `checkAppIsPurchased` does; answers on this thread or the store's.
  void appSupportAvailability(const std::string& bundleIdentifier, const AvailabilityReply& withReply) const;
  /// The store part alone; null when the look-up failed. Answers on this thread or the store's.
  void checkIsAvailableInStore(const std::string& bundleIdentifier, const AvailabilityReply& withReply) const;
  /// The purchase part alone. Blocks for 5 seconds at most; a later answer is ignored.
  Value::Dictionary checkAppIsPurchased(const std::string& bundleIdentifier) const;

 private:
  Platform& platform_;
};

}  // namespace kvr
