#pragma once

#include "platform/services/FollowUpCenter.h"

#include <optional>
#include <string>
#include <vector>

namespace kvr {

/// Where follow-ups are kept. Any thread; every operation is done when it returns.
class KVRFollowUpProvider {
 public:
  virtual ~KVRFollowUpProvider() = default;
  /// Posts an item, in the place of one with the same unique identifier. Nothing on success.
  virtual std::optional<Error> postFollowUpItem(const FollowUpItem& item) = 0;
  /// Nothing on success.
  virtual std::optional<Error> clearPendingFollowUpItemsWithUniqueIdentifiers(
      const std::vector<std::string>& uniqueIdentifiers) = 0;
  virtual Result<std::vector<FollowUpItem>> pendingFollowUpItems() = 0;
};

}  // namespace kvr
