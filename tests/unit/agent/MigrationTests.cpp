#include "core/agent/KVRAgent.h"
#include "core/warranty/CacheMetadata.h"
#include "platform/names/Names.h"
#include "unit/OfferWorld.h"

namespace kvr {
namespace {

const std::string kFolder = "/home/user/Library/Application Support";
const std::string kLegacyFile = kFolder + "/com.tarsil.Kavrel/Warranty.plist";

using Migration = AnOfferTest;

TEST_F(Migration, BringsWhatThereIsOfTheOldLayoutToTheNewOneOnce) {
  const std::string legacy = names::kFollowUpClient;
  const std::string own = legacy + "." + sha256Hash("LOCAL");
  const CacheMetadata metadata("LOCAL");
  auto& preferences = world.preferences;
  for (int bits = 0; bits < 128; ++bits) {
    const bool hasFile = bits & 1, hasItem = bits & 2, hasDate = bits & 4, hasSerial = bits & 8,
               hasLocale = bits & 16, hasVersion = !hasItem;
    const int level = bits / 32;
    SCOPED_TRACE(bits);
    for (const auto& key : preferences.allKeys()) preferences.removeObject(key);
    world.files.erase("/home/user/Library/FollowUps/com.tarsil.Kavrel.plist");
    for (const auto& path : world.files.list(kFolder)) world.files.erase(path);
    world.deviceProperties.answers["SerialNumber"] = "LOCAL";
    if (!hasSerial) world.deviceProperties.answers.erase("SerialNumber");
    if (hasFile) world.files.putPropertyList(kLegacyFile, offer(10));
    if (hasItem) pend(legacy);
    if (hasDate) preferences.setObject(inDays(-1), "CachedWarrantyLastUpdatedDate");
    if (hasLocale) preferences.setObject("en_US", "CachedWarrantyLocale");
    if (hasVersion) preferences.setObject("1", "CachedWarrantyVersion");
    preferences.setObject("stale", metadata.versionKey);
    if (level > 0) preferences.setObject(level, preference::kMigrationVersion);
    KVRAgent::initWithCallingProcessBundleID(world.platform, "client")->performMigrationIfNeeded();

    const auto dateWhere = [&](bool it) { return it ? std::optional(inDays(-1)) : std::nullopt; };
    const bool runs = level < 2;
    const bool moves = runs && hasFile && hasSerial;
    EXPECT_EQ(preferences.integerForKey(preference::kMigrationVersion), runs ? 2 : level);
    EXPECT_EQ(world.files.get(kLegacyFile).has_value(), hasFile && !moves);
    EXPECT_EQ(KVRWarranty::cachedWarrantyForSerialNumber(world.platform, "LOCAL") != nullptr, moves);
    EXPECT_EQ(KVRWarranty::cachedWarrantyForSerialNumber(world.platform, {}) != nullptr, hasFile && !moves);
    EXPECT_EQ(world.files.list(kFolder).size(), hasFile ? 1U : 0U);
    EXPECT_EQ(preferences.dateForKey(metadata.lastUpdatedDateKey), dateWhere(moves && hasDate));
    EXPECT_EQ(preferences.dateForKey("CachedWarrantyLastUpdatedDate"), dateWhere(hasDate && !moves));
    const bool pairMoves = moves && hasLocale;  // a version moves only together with its locale
    const Value locale = hasLocale ? Value("en_US") : Value(), version = hasVersion ? Value("1") : Value();
    EXPECT_EQ(preferences.objectForKey(metadata.localeKey), pairMoves ? locale : Value());
    EXPECT_EQ(preferences.objectForKey("CachedWarrantyLocale"), pairMoves ? Value() : locale);
    EXPECT_EQ(preferences.objectForKey(metadata.versionKey), pairMoves ? version : Value("stale"));
    EXPECT_EQ(preferences.objectForKey("CachedWarrantyVersion"), pairMoves ? Value() : version);
    const auto items = pending();
    ASSERT_THAT(items, SizeIs(hasItem && (moves || !runs) ? 1 : 0));
    for (const auto& item : items) EXPECT_EQ(item.uniqueIdentifier, runs ? own : legacy);
  }
}

}  // namespace
}  // namespace kvr
