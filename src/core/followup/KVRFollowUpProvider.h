#pragma once

#include "platform/services/FollowUpCenter.h"

#include <optional>
#include <string>
#include <vector>

namespace kvr {

/// Where follow-ups are kept. Any thread; all operations are synchronous.
class KVRFollowUpProvider {
 public:
  virtual ~KVRFollowUpProvider() = default;
  /// Posts an item; it replaces one with the same unique identifier. Nothing on success.
  virtual std::optional<Error> postFollowUpItem(const FollowUpItem& item) = 0;
  /// Nothing on success.
  virtual std::optional<Error> clearPendingFollowUpItemsWithUniqueIdentifiers(
      const std::vector<std::string>& uniqueIdentifiers) = 0;
  virtual Result<std::vector<FollowUpItem>> pendingFollowUpItems() = 0;
};

}  // namespace kvr
