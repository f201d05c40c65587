#include "local/device/LocalStore.h"

#include <algorithm>
#include <utility>

namespace kvr {
namespace {

constexpr const char* kFile = "Store.plist";

/// The dictionaries in a list that belong to one of the bundles.
std::vector<Value> entriesAbout(const std::vector<std::string>& bundleIdentifiers, const Value& list) {
  std::vector<Value> entries;
  if (!list.isArray()) return entries;
  for (const auto& entry : list.array()) {
    const auto bundle = entry["bundleIdentifier"].stringIfAny();
    if (bundle && std::ranges::find(bundleIdentifiers, *bundle) != bundleIdentifiers.end()) {
      entries.push_back(entry);
    }
  }
  return entries;
}

CatalogueItem itemIn(const Value& entry) {
  CatalogueItem item{entry["displayName"].stringIfAny(),
                     entry["artistName"].stringIfAny(),
                     entry["productPageURL"].stringIfAny(),
                     {}};
  if (entry["artwork"].isArray()) {
    for (const auto& artwork : entry["artwork"].array())
      item.artworkURLs.push_back(artwork["url"].stringIfAny());
  }
  return item;
}

}  // namespace

void LocalStore::purchaseHistory(std::int64_t /*storeAccountIdentifier*/,
                                 std::vector<std::string> bundleIdentifiers, PurchasesReply reply) {
  const auto store = root_.dictionary(kFile);
  std::vector<PurchasedApplication> purchases;
  for (const auto& entry : entriesAbout(bundleIdentifiers, store["purchases"])) {
    purchases.push_back({entry["bundleIdentifier"].string(), entry["title"].stringIfAny(),
                         entry["developerName"].stringIfAny(), entry["productURL"].stringIfAny()});
  }
  const auto& delay = store["purchaseDelay"];
  answers_.after(delay.isNumber() ? delay.asDouble() : 0,
                 [purchases = std::move(purchases), reply = std::move(reply)](bool ending) {
                   reply(ending ? std::vector<PurchasedApplication>() : purchases);
                 });
}

void LocalStore::lookUp(std::vector<std::string> bundleIdentifiers, const std::string& /*caller*/,
                        CatalogueReply reply) {
  const auto store = root_.dictionary(kFile);
  std::vector<CatalogueItem> items;
  for (const auto& entry : entriesAbout(bundleIdentifiers, store["catalogue"]))
    items.push_back(itemIn(entry));
  const auto failure = store["catalogueError"].stringIfAny();
  answers_.after(0, [items = std::move(items), failure, reply = std::move(reply)](bool) {
    if (failure) return reply(std::nullopt, Error{"store", 0, *failure});
    reply(items, std::nullopt);
  });
}

}  // namespace kvr
