#include "core/agent/KVRAgent.h"
#include "core/warranty/CacheMetadata.h"
#include "platform/names/Names.h"
#include "unit/OfferWorld.h"

namespace kvr {
namespace {

const std::string kFolder = "/home/user/Library/Application Support";
const std::string kLegacyFile = kFolder + "/com.tarsil.Kavrel/Warranty.plist";

struct Migration : AnOfferTest {
  /// The old layout with these of its parts, and an own version that is nobody's.
  void setUp(std::string_view parts) {
    const auto has = [parts](std::string_view part) { return parts.find(part) != std::string_view::npos; };
    for (const auto& key : world.preferences.allKeys()) world.preferences.removeObject(key);
    world.files.erase("/home/user/Library/FollowUps/com.tarsil.Kavrel.plist");
    for (const auto& path : world.files.list(kFolder)) world.files.erase(path);
    if (has("file")) world.files.putPropertyList(kLegacyFile, offer(10));
    if (has("item")) pend(names::kFollowUpClient);
    if (has("date")) world.preferences.setObject(inDays(-1), "CachedWarrantyLastUpdatedDate");
    if (has("locale")) world.preferences.setObject("en_US", "CachedWarrantyLocale");
    if (has("version")) world.preferences.setObject("1", "CachedWarrantyVersion");
    world.preferences.setObject("stale", own.versionKey);
  }
  /// The parts that there are, under the old names or under the device's.
  std::string parts(bool isOwn) {
    std::string found;
    const auto add = [&found](bool exists, const char* part) {
      if (exists) found += (found.empty() ? "" : " ") + std::string(part);
    };
    const auto stored = [this](const std::string& key) { return world.preferences.objectForKey(key); };
    const std::string item = names::kFollowUpClient + (isOwn ? "." + sha256Hash("LOCAL") : std::string());
    add(isOwn ? KVRWarranty::cachedWarrantyForSerialNumber(world.platform, "LOCAL") != nullptr
              : world.files.get(kLegacyFile).has_value(),
        "file");
    add(pending().size() == 1 && pending()[0].uniqueIdentifier == item, "item");
    add(stored(isOwn ? own.lastUpdatedDateKey : "CachedWarrantyLastUpdatedDate") == Value(inDays(-1)),
        "date");
    add(stored(isOwn ? own.localeKey : "CachedWarrantyLocale") == Value("en_US"), "locale");
    add(stored(isOwn ? own.versionKey : "CachedWarrantyVersion") == Value("1"), "version");
    add(isOwn && stored(own.versionKey) == Value("stale"), "stale");
    return found;
  }
  const CacheMetadata own{"LOCAL"};
};

TEST_F(Migration, BringsWhatThereIsOfTheOldLayoutToTheNewOneOnce) {
  const std::string all = "file item date locale version";
  struct Case {
    int level;
    bool hasSerialNumber;
    std::string before, oldAfter, ownAfter;
  };
  const Case cases[] = {
      {0, true, all, "", all},
      {1, true, all, "", all},
      {2, true, all, all, "stale"},
      {3, true, all, all, "stale"},
      {0, true, "", "", "stale"},
      {0, true, "file", "", "file stale"},
      {0, true, "file locale", "", "file locale"},  // without a version of its own
      {0, true, "file date version", "version", "file date stale"},
      {0, true, "item date locale version", "date locale version", "stale"},  // the item is cleared
      {0, false, all, "file date locale version", "stale"},
  };
  for (const auto& [level, hasSerialNumber, before, oldAfter, ownAfter] : cases) {
    SCOPED_TRACE(std::to_string(level) + ": " + before);
    setUp(before);
    world.deviceProperties.answers["SerialNumber"] = "LOCAL";
    if (!hasSerialNumber) world.deviceProperties.answers.erase("SerialNumber");
    if (level > 0) world.preferences.setObject(level, preference::kMigrationVersion);
    KVRAgent::initWithCallingProcessBundleID(world.platform, "client")->performMigrationIfNeeded();
    EXPECT_EQ(parts(false), oldAfter);
    EXPECT_EQ(parts(true), ownAfter);
    EXPECT_EQ(world.preferences.integerForKey(preference::kMigrationVersion), std::max(level, 2));
  }
}

}  // namespace
}  // namespace kvr
