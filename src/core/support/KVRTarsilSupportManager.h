#pragma once

#include "platform/Platform.h"
#include "platform/log/Completion.h"
#include "platform/value/Value.h"

#include <string>

namespace kvr {

/// How the application stands, or null when the store could not be asked.
using AvailabilityReply = Completion<Value>;

/// Tells how the maker's support application stands on this device: installed, bought earlier, available in
/// the store, or none of these. The answer is a dictionary with the keys of `availability`.
///
/// Made for one request; keeps nothing.
class KVRTarsilSupportManager {
 public:
  explicit KVRTarsilSupportManager(Platform& platform) : platform_(platform) {}

  /// The full answer; it always names the bundle, and no more than that when the store could not be asked.
  /// May block for as long as `checkAppIsPurchased` does; answers on this thread or the store's.
  void appSupportAvailability(const std::string& bundleIdentifier, const AvailabilityReply& withReply) const;
  /// The store's part alone; null when the look-up failed. Answers on this thread or the store's.
  void checkIsAvailableInStore(const std::string& bundleIdentifier, const AvailabilityReply& withReply) const;
  /// The purchase's part alone. Blocks for 5 seconds at most; an answer that takes longer is none.
  Value::Dictionary checkAppIsPurchased(const std::string& bundleIdentifier) const;

 private:
  Platform& platform_;
};

}  // namespace kvr
