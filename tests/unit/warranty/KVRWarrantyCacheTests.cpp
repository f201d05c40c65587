#include "signing/SHA256Hash.h"
#include "unit/SimulatedTest.h"
#include "warranty/CacheMetadata.h"
#include "warranty/KVRWarranty.h"
#include "warranty/WarrantyKeys.h"

#include <map>
#include <set>

namespace kvr {
namespace {

using ::testing::Each;
using ::testing::HasSubstr;
using ::testing::Not;

class TheWarrantyCache : public SimulatedTest {
 protected:
  static constexpr const char* kDirectory = "/home/user/Library/Application Support/com.tarsil.Kavrel";
  static constexpr const char* kLegacyPath =
      "/home/user/Library/Application Support/com.tarsil.Kavrel/Warranty.plist";

  std::shared_ptr<KVRWarranty> cached(const std::optional<std::string>& serialNumber) {
    return KVRWarranty::cachedWarrantyForSerialNumber(simulated.platform, serialNumber);
  }
  void store(const Value& dictionary, const std::optional<std::string>& serialNumber) {
    KVRWarranty::initWithDictionary(simulated.platform, dictionary)->cacheWarranty(serialNumber);
  }
};

TEST_F(TheWarrantyCache, KeepsOneFileADeviceNamedByTheHash) {
  store(Value::Dictionary{{"covered", true}}, "SN0000000001");
  store(Value::Dictionary{{"covered", false}}, "SN0000000002");
  EXPECT_THAT(simulated.files.list(kDirectory),
              ::testing::UnorderedElementsAre(
                  std::string(kDirectory) + "/" + sha256Hash("SN0000000001") + "_Warranty.plist",
                  std::string(kDirectory) + "/" + sha256Hash("SN0000000002") + "_Warranty.plist"));
  EXPECT_THAT(simulated.files.list("/"), Each(Not(HasSubstr("SN0000"))));
  EXPECT_THAT(*simulated.files.get(simulated.files.list(kDirectory)[0]), ::testing::StartsWith("<?xml"));
  EXPECT_TRUE(cached("SN0000000001")->covered());
  EXPECT_FALSE(cached("SN0000000002")->covered());
}

TEST_F(TheWarrantyCache, HasTheLegacyFileForNoDeviceOnly) {
  simulated.files.putPropertyList(kLegacyPath, Value::Dictionary{{"covered", true}});
  EXPECT_EQ(cached("SN"), nullptr);
  EXPECT_NE(cached(std::nullopt), nullptr);
}

TEST_F(TheWarrantyCache, KeepsTheOldFileWhenTheNewTreeDoesNotFitOrCannotBeWritten) {
  store(Value::Dictionary{{"covered", true}}, "SN");
  store(Value::Dictionary{{"covered", Value()}}, "SN");
  store(Value::Dictionary{{"text", std::string("a\x01")}}, "SN");
  simulated.files.setWriteFault(Error{"files", ENOSPC, "no space"});
  store(Value::Dictionary{{"covered", false}}, "SN");
  EXPECT_TRUE(cached("SN")->covered());
}

TEST_F(TheWarrantyCache, MigratesTheLegacyLayoutWithWhateverOfItIsThere) {
  const CacheMetadata metadata("SN");
  const std::string date = preference::kCachedWarrantyLastUpdatedDate;
  const std::string locale = preference::kCachedWarrantyLocale;
  const std::string version = preference::kCachedWarrantyVersion;
  const std::map<std::string, std::string> keys = {
      {date, metadata.lastUpdatedDateKey}, {locale, metadata.localeKey}, {version, metadata.versionKey}};
  const struct {
    bool hasFile;
    std::set<std::string> entries, moved;
  } cases[] = {
      {true, {date, locale, version}, {date, locale, version}},
      {true, {date, version}, {date}},
      {true, {locale}, {locale}},
      {true, {version}, {}},
      {true, {}, {}},
      {false, {date, locale, version}, {}},
  };
  for (const auto& test : cases) {
    SimulatedPlatform fresh;
    auto& preferences = fresh.preferences;
    if (test.hasFile) fresh.files.putPropertyList(kLegacyPath, Value::Dictionary{{"covered", true}});
    const auto valueOf = [&](const std::string& key) { return key == date ? Value(Date{5}) : Value(key); };
    for (const auto& key : test.entries) preferences.setObject(valueOf(key), key);
    // A version of the time before the locale that is moved goes with that time.
    if (test.moved.contains(locale)) preferences.setObject("stale", metadata.versionKey);

    const auto migrated =
        KVRWarranty::migrateLegacyCachedWarrantyIfNeededForSerialNumber(fresh.platform, "SN");
    EXPECT_EQ(migrated != nullptr, test.hasFile);
    EXPECT_EQ(KVRWarranty::cachedWarrantyForSerialNumber(fresh.platform, "SN") != nullptr, test.hasFile);
    EXPECT_FALSE(fresh.files.get(kLegacyPath).has_value());
    for (const auto& [from, to] : keys) {
      const bool moves = test.moved.contains(from);
      const bool stays = test.entries.contains(from) && !moves;
      EXPECT_EQ(preferences.objectForKey(from), stays ? valueOf(from) : Value()) << from;
      EXPECT_EQ(preferences.objectForKey(to), moves ? valueOf(from) : Value()) << to;
    }
    EXPECT_THAT(fresh.faults(), ::testing::IsEmpty());
  }
}

}  // namespace
}  // namespace kvr
