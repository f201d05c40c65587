#include "signing/SHA256Hash.h"
#include "unit/SimulatedTest.h"
#include "warranty/CacheMetadata.h"
#include "warranty/KVRAgentDefaultWarrantyProvider.h"

namespace kvr {
namespace {

using ::testing::Each;
using ::testing::ElementsAre;
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

TEST_F(TheWarrantyCache, AnswersNothingForWhatIsMissingOrDamaged) {
  simulated.files.putPropertyList(kLegacyPath, Value::Dictionary{{"covered", true}});
  EXPECT_EQ(cached("SN"), nullptr) << "the legacy file is nobody's";
  EXPECT_NE(cached(std::nullopt), nullptr);

  const auto path = std::string(kDirectory) + "/" + sha256Hash("SN") + "_Warranty.plist";
  for (const char* bytes : {"", "<plist><dict><key>half", "bplist00garbage", "( an, array )"}) {
    simulated.files.put(path, bytes);
    simulated.log.clear();
    EXPECT_EQ(cached("SN"), nullptr) << bytes;
    EXPECT_EQ(simulated.log.texts(LogLevel::Error).size(), 1U) << bytes;
  }
}

TEST_F(TheWarrantyCache, KeepsTheOldFileWhenTheNewTreeDoesNotFitOrCannotBeWritten) {
  store(Value::Dictionary{{"covered", true}}, "SN");
  store(Value::Dictionary{{"covered", Value()}}, "SN");
  store(Value::Dictionary{{"text", std::string("a\x01")}}, "SN");
  simulated.files.setWriteFault(Error{"files", ENOSPC, "no space"});
  store(Value::Dictionary{{"covered", false}}, "SN");
  EXPECT_TRUE(cached("SN")->covered());
}

TEST_F(TheWarrantyCache, AnswersTheProvidersQuestionsFromThePreferences) {
  KVRAgentDefaultWarrantyProvider provider(simulated.platform, "com.example.client");
  const CacheMetadata metadata("SN");
  EXPECT_EQ(provider.lastUpdatedDateForSerialNumber("SN"), std::nullopt);
  EXPECT_EQ(provider.cachedWarrantyValidityDuration(), 0);
  EXPECT_EQ(provider.migrationVersion(), 0);
  EXPECT_FALSE(provider.isSignedInToNimbra());

  simulated.preferences.setObject(Date{5}, metadata.lastUpdatedDateKey);
  simulated.preferences.setObject("fr_FR", metadata.localeKey);
  simulated.preferences.setObject("2", metadata.versionKey);
  provider.setMigrationVersion(3);
  simulated.accounts.primary = CloudAccount{};
  EXPECT_EQ(provider.lastUpdatedDateForSerialNumber("SN"), Date{5});
  EXPECT_EQ(provider.cachedWarrantyLocaleForSerialNumber("SN"), "fr_FR");
  EXPECT_EQ(provider.cachedWarrantyVersionForSerialNumber("SN"), "2");
  EXPECT_EQ(provider.cachedWarrantyLocaleForSerialNumber("other"), std::nullopt);
  EXPECT_EQ(provider.migrationVersion(), 3);
  EXPECT_TRUE(provider.isSignedInToNimbra());
}

TEST_F(TheWarrantyCache, MigratesTheLegacyLayoutWithWhateverOfItIsThere) {
  const CacheMetadata metadata("SN");
  struct Case {
    bool file, date, locale, version;
    bool dateMoves, localeMoves, versionMoves;
  };
  const Case cases[] = {
      {true, true, true, true, true, true, true},      {true, false, false, false, false, false, false},
      {true, true, false, true, true, false, false},   {true, false, true, false, false, true, false},
      {true, false, false, true, false, false, false}, {false, true, true, true, false, false, false},
  };
  for (const auto& test : cases) {
    SimulatedPlatform fresh;
    auto& preferences = fresh.preferences;
    if (test.file) fresh.files.putPropertyList(kLegacyPath, Value::Dictionary{{"covered", true}});
    if (test.date) preferences.setObject(Date{5}, preference::kCachedWarrantyLastUpdatedDate);
    if (test.locale) preferences.setObject("en_US", preference::kCachedWarrantyLocale);
    if (test.version) preferences.setObject("1", preference::kCachedWarrantyVersion);
    if (!test.version) preferences.setObject("stale", metadata.versionKey);

    const auto migrated =
        KVRWarranty::migrateLegacyCachedWarrantyIfNeededForSerialNumber(fresh.platform, "SN");
    EXPECT_EQ(migrated != nullptr, test.file);
    EXPECT_EQ(KVRWarranty::cachedWarrantyForSerialNumber(fresh.platform, "SN") != nullptr, test.file);
    EXPECT_FALSE(fresh.files.get(kLegacyPath).has_value());
    const auto moved = [&](const char* from, const std::string& to, const Value& value, bool was,
                           bool moves) {
      EXPECT_EQ(preferences.objectForKey(from), was && !moves ? value : Value()) << from;
      if (was || moves) {
        EXPECT_EQ(preferences.objectForKey(to), moves ? value : Value()) << to;
      }
    };
    moved(preference::kCachedWarrantyLastUpdatedDate, metadata.lastUpdatedDateKey, Date{5}, test.date,
          test.dateMoves);
    moved(preference::kCachedWarrantyLocale, metadata.localeKey, "en_US", test.locale, test.localeMoves);
    moved(preference::kCachedWarrantyVersion, metadata.versionKey, "1", test.version, test.versionMoves);
    if (!test.version) {
      EXPECT_EQ(preferences.objectForKey(metadata.versionKey), test.localeMoves ? Value() : Value("stale"));
    }
    EXPECT_THAT(fresh.faults(), ::testing::IsEmpty());
  }
}

}  // namespace
}  // namespace kvr
