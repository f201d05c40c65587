#include "core/support/KVRTarsilSupportManager.h"

#include "core/support/SupportKeys.h"

#include <algorithm>
#include <mutex>

namespace kvr {
namespace {

constexpr double kPurchaseLimit = 5;  // seconds
constexpr const char* kStoreQuery = "?pt=2003&ct=coverage.settings&mt=8";
constexpr const char* kUntitled = "== Tarsil Support ==";
constexpr const char* kUnknownVendor = "== Tarsil ==";

constexpr const char* kResourceBundle = "KavrelUI";
constexpr const char* kStringTable = "Localizable";
constexpr const char* kInstalledKey = "INSTALLED";

std::string storeLink(const std::optional<std::string>& productURL) {
  return productURL && !productURL->empty() ? *productURL + kStoreQuery : std::string();
}

/// The text for the installed state; the key itself if no table has a text.
std::string installedText(const StringTables& tables) {
  auto text = tables.localizedString(kResourceBundle, kStringTable, kInstalledKey, "");
  return text.empty() ? kInstalledKey : text;
}

void addAll(Value::Dictionary& answer, const Value::Dictionary& entries) {
  for (const auto& [key, value] : entries) answer.insert_or_assign(key, value);
}

/// A purchase answer, shared with the store's reply because it may come after the wait has ended.
struct Purchase {
  std::mutex mutex;  ///< guards the members below
  Value::Dictionary found{{availability::kType, availability::NotFound}};
};

Value::Dictionary purchaseEntries(const PurchasedApplication& application) {
  return {{availability::kLinkURL, storeLink(application.productURL)},
          {availability::kTitle, application.title.value_or(kUntitled)},
          {availability::kVendorName, application.developerName.value_or(kUnknownVendor)},
          {availability::kText, "DOWNLOAD"},
          {availability::kType, availability::Purchased}};
}

Value::Dictionary catalogueEntries(const std::vector<CatalogueItem>& items) {
  if (items.size() != 1) return {{availability::kType, availability::NotFound}};
  const auto& item = items.front();
  const auto icon = item.artworkURLs.empty() ? std::nullopt : item.artworkURLs.front();
  return {{availability::kLinkURL, storeLink(item.productPageURL)},
          {availability::kIconURL, icon.value_or("")},
          {availability::kTitle, item.displayName.value_or("")},
          {availability::kVendorName, item.artistName.value_or("")},
          {availability::kText, "Free – On the Quillmart"},
          {availability::kType, availability::InStore}};
}

}  // namespace

void KVRTarsilSupportManager::appSupportAvailability(const std::string& bundleIdentifier,
                                                     const AvailabilityReply& withReply) const {
  auto& log = platform_.log;
  Value::Dictionary answer{{availability::kBundleID, bundleIdentifier}};
  if (const auto record = platform_.applications.installedApplication(bundleIdentifier)) {
    log.standard("appSupportAvailability %@ %@ is installed.", bundleIdentifier, record->localizedName);
    addAll(answer, {{availability::kTitle, record->localizedName.value_or("")},
                    {availability::kVendorName, record->vendorName.value_or("")},
                    {availability::kText, installedText(platform_.stringTables)},
                    {availability::kType, availability::Installed}});
    return withReply(answer);
  }
  const auto purchase = checkAppIsPurchased(bundleIdentifier);
  if (purchase.at(availability::kType).asInteger() != availability::NotFound) {
    log.standard("appSupportAvailability %@ is purchased.", bundleIdentifier);
    addAll(answer, purchase);
    return withReply(answer);
  }
  checkIsAvailableInStore(
      bundleIdentifier,
      AvailabilityReply(log, "appSupportAvailability", [&log, answer, withReply](const Value& store) {
        log.standard("Quillmart --> appSupportAvailability %@.", store);
        auto whole = answer;
        if (store.isDictionary()) addAll(whole, store.dictionary());
        withReply(whole);
      }));
}

void KVRTarsilSupportManager::checkIsAvailableInStore(const std::string& bundleIdentifier,
                                                      const AvailabilityReply& withReply) const {
  auto& log = platform_.log;
  log.standard("Checking for %@ in the Quillmart", bundleIdentifier);
  if (platform_.preferences.boolForKey(preference::kAppSupportAvailability)) {
    return withReply(Value::Dictionary{{availability::kTitle, "Tarsil Support"},
                                       {availability::kVendorName, "Tarsil"},
                                       {availability::kText, "OVERRIDE"},
                                       {availability::kType, availability::Installed}});
  }
  platform_.store.lookUp(
      {bundleIdentifier}, bundleIdentifier,
      [&log, bundleIdentifier, withReply](const std::optional<std::vector<CatalogueItem>>& result,
                                          const std::optional<Error>& error) {
        if (result && !error) return withReply(catalogueEntries(*result));
        log.standard("Lookup for %@ in the Quillmart failed with error %@", bundleIdentifier, error);
        withReply({});
      });
}

Value::Dictionary KVRTarsilSupportManager::checkAppIsPurchased(const std::string& bundleIdentifier) const {
  const auto purchase = std::make_shared<Purchase>();
  const auto answered = platform_.queues.newSignal();
  std::int64_t storeAccountIdentifier = 0;
  if (const auto account = platform_.accounts.primaryAccount()) {
    if (const auto store = platform_.accounts.storeAccountFor(*account))
      storeAccountIdentifier = store->identifier;
  }
  platform_.store.purchaseHistory(
      storeAccountIdentifier, {bundleIdentifier},
      [purchase, answered, bundleIdentifier](const std::vector<PurchasedApplication>& applications) {
        const auto found =
            std::ranges::find(applications, bundleIdentifier, &PurchasedApplication::bundleIdentifier);
        if (found != applications.end()) {
          const std::lock_guard lock(purchase->mutex);
          addAll(purchase->found, purchaseEntries(*found));
        }
        answered->signal();
      });
  answered->wait(kPurchaseLimit);
  const std::lock_guard lock(purchase->mutex);
  return purchase->found;
}

}  // namespace kvr
