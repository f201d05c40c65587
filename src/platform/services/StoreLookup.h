#pragma once

#include "platform/value/Error.h"

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace kvr {

/// An application that an account has bought, or got for free.
struct PurchasedApplication {
  std::string bundleIdentifier;
  std::optional<std::string> title;
  std::optional<std::string> developerName;
  std::optional<std::string> productURL;
};

/// An application that the store offers.
struct CatalogueItem {
  std::optional<std::string> displayName;
  std::optional<std::string> artistName;
  std::optional<std::string> productPageURL;
  std::vector<std::optional<std::string>> artworkURLs;
};

/// The application store. Both operations return at once; each reply is called exactly once, on a thread of
/// the store's own, however long the answer takes. Any thread.
class StoreLookup {
 public:
  using PurchasesReply = std::function<void(std::vector<PurchasedApplication>)>;
  /// What was found, or nothing and the error.
  using CatalogueReply =
      std::function<void(std::optional<std::vector<CatalogueItem>>, std::optional<Error> error)>;

  virtual ~StoreLookup() = default;
  /// Which of the named applications the account has bought. 0 means no account.
  virtual void purchaseHistory(std::int64_t storeAccountIdentifier,
                               std::vector<std::string> bundleIdentifiers, PurchasesReply reply) = 0;
  /// `caller` is the bundle on whose behalf the store is asked.
  virtual void lookUp(std::vector<std::string> bundleIdentifiers, const std::string& caller,
                      CatalogueReply reply) = 0;
};

}  // namespace kvr
