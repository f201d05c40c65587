#include "core/followup/KVRDefaultFolllowUpProvider.h"

#include "core/followup/FollowUpKeys.h"
#include "platform/names/Names.h"

namespace kvr {

std::unique_ptr<FollowUpCenterClient> KVRDefaultFolllowUpProvider::newClient() const {
  return platform_.followUps.newClient(names::kFollowUpClient);
}

std::optional<Error> KVRDefaultFolllowUpProvider::postFollowUpItem(const FollowUpItem& item) {
  return newClient()->postItem(item);
}

std::optional<Error> KVRDefaultFolllowUpProvider::clearPendingFollowUpItemsWithUniqueIdentifiers(
    const std::vector<std::string>& uniqueIdentifiers) {
  return newClient()->clearPendingItems(uniqueIdentifiers);
}

Result<std::vector<FollowUpItem>> KVRDefaultFolllowUpProvider::pendingFollowUpItems() {
  return newClient()->pendingItems();
}

}  // namespace kvr
