#pragma once

#include "core/followup/KVRFollowUpProvider.h"
#include "platform/Platform.h"

#include <memory>

namespace kvr {

/// Uses the platform's follow-up centre, with a new client for each call. No state.
class KVRDefaultFolllowUpProvider : public KVRFollowUpProvider {
 public:
  explicit KVRDefaultFolllowUpProvider(Platform& platform) : platform_(platform) {}

  std::optional<Error> postFollowUpItem(const FollowUpItem& item) override;
  std::optional<Error> clearPendingFollowUpItemsWithUniqueIdentifiers(
      const std::vector<std::string>& uniqueIdentifiers) override;
  Result<std::vector<FollowUpItem>> pendingFollowUpItems() override;

 private:
  std::unique_ptr<FollowUpCenterClient> newClient() const;

  Platform& platform_;
};

}  // namespace kvr
