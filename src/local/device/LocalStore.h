#pragma once

#include "local/device/DelayedAnswers.h"
#include "local/device/DeviceRoot.h"
#include "platform/services/StoreLookup.h"

namespace kvr {

/// The store that "Store.plist" describes. The purchases are the same for every account.
class LocalStore : public StoreLookup {
 public:
  LocalStore(const DeviceRoot& root, Log& log) : root_(root), answers_(log) {}

  void purchaseHistory(std::int64_t storeAccountIdentifier, std::vector<std::string> bundleIdentifiers,
                       PurchasesReply reply) override;
  void lookUp(std::vector<std::string> bundleIdentifiers, const std::string& caller,
              CatalogueReply reply) override;
  /// Gives every outstanding answer, and every later one, at once.
  void beginEnding() { answers_.end(); }

 private:
  const DeviceRoot& root_;
  DelayedAnswers answers_;  ///< destroyed first
};

}  // namespace kvr
