#include "core/support/KVRTarsilSupportManager.h"
#include "core/support/SupportKeys.h"
#include "unit/SimulatedTest.h"

namespace kvr {
namespace {

constexpr const char* kBundle = "com.tarsil.support";

struct TheSupportApplication : SimulatedTest {
  /// The entries of the whole answer, or of its store part, without the bundle identifier.
  Value answer(bool storeOnly = false) {
    Array answers;
    const AvailabilityReply reply(world.log, "test", [&](const Value& it) { answers.push_back(it); });
    world.queues.concurrentQueue(Priority::Default)->async([this, reply, storeOnly] {
      const KVRTarsilSupportManager manager(world.platform);
      storeOnly ? manager.checkIsAvailableInStore(kBundle, reply)
                : manager.appSupportAvailability(kBundle, reply);
    });
    world.queues.advance(10);
    if (answers.size() != 1) return "not one answer";
    if (!answers[0].isDictionary()) return answers[0];
    auto entries = answers[0].dictionary();
    EXPECT_EQ(storeOnly, entries.erase(availability::kBundleID) == 0);
    return entries;
  }
  static Dictionary entries(std::int64_t type, const char* text, const char* title, const char* vendor) {
    return {{availability::kType, type},
            {availability::kText, text},
            {availability::kTitle, title},
            {availability::kVendorName, vendor}};
  }
};

TEST_F(TheSupportApplication, IsInstalledBoughtInTheStoreOrNotThere) {
  auto& store = world.store;
  EXPECT_EQ(answer(), Value(Dictionary{{availability::kType, availability::NotFound}}));
  const CatalogueItem item{"Support", "Tarsil", "https://store/x", {"https://icon", "https://other"}};
  auto inStore = entries(availability::InStore, "Free – On the Quillmart", "Support", "Tarsil");
  inStore[availability::kLinkURL] = "https://store/x?pt=2003&ct=coverage.settings&mt=8";
  inStore[availability::kIconURL] = "https://icon";
  store.catalogue = {{item}};
  EXPECT_EQ(answer(), Value(inStore));
  EXPECT_EQ(answer(true), Value(inStore));
  store.catalogue = {{item, item}};
  EXPECT_EQ(answer(), Value(Dictionary{{availability::kType, availability::NotFound}}));
  store.catalogue = {{CatalogueItem{}}};
  auto bare = entries(availability::InStore, "Free – On the Quillmart", "", "");
  bare[availability::kLinkURL] = bare[availability::kIconURL] = "";
  EXPECT_EQ(answer(), Value(bare));
  store.catalogueError = Error{"store", 7, "closed"};
  EXPECT_EQ(answer(), Value(Dictionary{}));
  EXPECT_TRUE(answer(true).isNull());
  EXPECT_TRUE(world.log.contains("Lookup for com.tarsil.support in the Quillmart failed with error Error "));

  world.accounts.primary = CloudAccount{"alt"};
  world.accounts.store = StoreAccount{42, {}};
  store.purchases = {{"another", "A", "B", "C"}, {kBundle, {}, {}, ""}};
  auto bought = entries(availability::Purchased, "DOWNLOAD", "== Tarsil Support ==", "== Tarsil ==");
  bought[availability::kLinkURL] = "";
  EXPECT_EQ(answer(), Value(bought));
  EXPECT_EQ(store.purchaseQueries.back(), 42);

  const auto queries = store.purchaseQueries.size();
  world.applications.installed[kBundle] = {};
  EXPECT_EQ(answer(), Value(entries(availability::Installed, "INSTALLED", "", "")));
  world.applications.installed[kBundle] = {"Support", "Tarsil"};
  world.stringTables.texts[{"KavrelUI", "Localizable", "INSTALLED"}] = "Installé";
  EXPECT_EQ(answer(), Value(entries(availability::Installed, "Installé", "Support", "Tarsil")));
  EXPECT_EQ(store.purchaseQueries.size(), queries);
}

TEST_F(TheSupportApplication, CountsAsNotBoughtWhenThatIsNotKnownInFiveSeconds) {
  world.store.purchases = {{kBundle, "S", "T", "U"}};
  for (const double delay : {4.9, 5.1}) {
    world.store.purchaseDelay = delay;
    EXPECT_EQ(answer()[availability::kType],
              Value(delay < 5 ? availability::Purchased : availability::NotFound));
  }
}

TEST_F(TheSupportApplication, CanBeOverriddenWithoutTheStoreBeingAsked) {
  world.preferences.setObject(true, preference::kAppSupportAvailability);
  const Value overridden = entries(availability::Installed, "OVERRIDE", "Tarsil Support", "Tarsil");
  EXPECT_EQ(answer(), overridden);
  EXPECT_EQ(answer(true), overridden);
  EXPECT_EQ(world.store.lookups, 0U);
}

}  // namespace
}  // namespace kvr
