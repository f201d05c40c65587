#include "agent/KVRAgent.h"
#include "unit/CoverageWorld.h"
#include "warranty/CacheMetadata.h"

namespace kvr {
namespace {

using ::testing::Contains;
using ::testing::ElementsAre;
using ::testing::IsEmpty;

/// A warranty provider whose facts are plain fields, and whose downloads a test lets go when it likes.
class FakeWarrantyProvider : public KVRAgentWarrantyProvider {
 public:
  KVRWarrantyRef cached;
  KVRWarrantyRef downloaded;
  std::optional<Date> lastUpdated;
  std::optional<std::string> version = "2";
  std::optional<std::string> locale = "en_US";
  bool signedIn = true;
  std::vector<std::string> downloads;
  KVRDeviceInfoList refreshed;

  KVRDeviceInfoList refreshFollowupWithDeviceInfos(const KVRDeviceInfoList& infos) override {
    return refreshed = infos;
  }
  KVRDeviceInfoList refreshFollowupWithDeviceInfo(const KVRDeviceInfoRef& info) override {
    return refreshed = {info};
  }
  void dismissFollowUpForSerialNumber(const std::string&) override {}
  void downloadWarrantyForSerialNumber(const std::string& serialNumber, DownloadCompletion handler) override {
    downloads.push_back(serialNumber);
    handler(downloaded != nullptr, downloaded);
  }
  KVRWarrantyRef cachedWarrantyForSerialNumber(const std::string&) override { return cached; }
  std::optional<Date> lastUpdatedDateForSerialNumber(const std::string&) override { return lastUpdated; }
  std::optional<std::string> cachedWarrantyVersionForSerialNumber(const std::string&) override {
    return version;
  }
  std::optional<std::string> cachedWarrantyLocaleForSerialNumber(const std::string&) override {
    return locale;
  }
  KVRWarrantyRef migrateLegacyCachedWarrantyIfNeededForSerialNumber(const std::string&) override {
    return nullptr;
  }
  void migrateLegacyFollowUpIfNeededWithDeviceInfo(const KVRDeviceInfoRef&) override {}
  double cachedWarrantyValidityDuration() override { return 86400; }
  bool isSignedInToNimbra() override { return signedIn; }
  std::int32_t migrationVersion() override { return 2; }
  void setMigrationVersion(std::int32_t) override {}
};

class ALookup : public SimulatedTest {
 protected:
  ALookup()
      : provider(std::make_shared<FakeWarrantyProvider>()),
        agent(std::make_shared<KVRAgent>(simulated.platform, provider, nullptr)),
        fromCache(warranty("cache")),
        fromDownload(warranty("download")) {
    simulated.clock.set(Date{1'800'000'000});
  }

  KVRWarrantyRef warranty(const char* mark) {
    return KVRWarranty::initWithDictionary(simulated.platform, Value::Dictionary{{"quorURL", mark}});
  }
  KVRWarrantyRef lookUp(std::uint64_t policy, const std::optional<std::string>& serialNumber = "SN") {
    std::optional<KVRWarrantyRef> answer;
    agent->getWarrantyUsingPolicy(
        policy, serialNumber,
        KVRAgent::WarrantyReply(simulated.log, "test", [&](const KVRWarrantyRef& it) { answer = it; }));
    return answer.value();
  }

  std::shared_ptr<FakeWarrantyProvider> provider;
  std::shared_ptr<KVRAgent> agent;
  KVRWarrantyRef fromCache;
  KVRWarrantyRef fromDownload;
};

TEST_F(ALookup, DecidesBetweenCacheAndDownload) {
  enum class Cache { Missing, Invalid, Stale, Undated, Fresh };
  enum class Reply { Nothing, Cached, Downloaded };
  struct Case {
    std::uint64_t policy;
    Cache cache;
    bool downloads;
    Reply whenItYields;
    Reply otherwise;
  };
  const Case cases[] = {
      {0, Cache::Fresh, false, Reply::Cached, Reply::Cached},
      {0, Cache::Stale, true, Reply::Downloaded, Reply::Cached},
      {0, Cache::Undated, true, Reply::Downloaded, Reply::Cached},
      {0, Cache::Invalid, true, Reply::Downloaded, Reply::Nothing},
      {0, Cache::Missing, true, Reply::Downloaded, Reply::Nothing},
      {1, Cache::Fresh, false, Reply::Cached, Reply::Cached},
      {1, Cache::Stale, false, Reply::Cached, Reply::Cached},
      {1, Cache::Invalid, false, Reply::Nothing, Reply::Nothing},
      {1, Cache::Missing, false, Reply::Nothing, Reply::Nothing},
      {7, Cache::Stale, false, Reply::Cached, Reply::Cached},
      {7, Cache::Missing, false, Reply::Nothing, Reply::Nothing},
      {2, Cache::Fresh, true, Reply::Downloaded, Reply::Nothing},
      {2, Cache::Invalid, true, Reply::Downloaded, Reply::Nothing},
      {2, Cache::Missing, true, Reply::Downloaded, Reply::Nothing},
  };
  for (const auto& test : cases) {
    provider->cached = test.cache == Cache::Missing ? nullptr : fromCache;
    provider->version = test.cache == Cache::Invalid ? "1" : "2";
    // A cache exactly at the end of its validity is stale.
    const double age = test.cache == Cache::Stale ? 86400 : 3600;
    provider->lastUpdated =
        test.cache == Cache::Undated ? std::nullopt : std::optional(simulated.clock.now() - age);
    for (const bool yields : {true, false}) {
      provider->downloaded = yields ? fromDownload : nullptr;
      provider->downloads.clear();
      const auto expected = yields ? test.whenItYields : test.otherwise;
      EXPECT_EQ(lookUp(test.policy), expected == Reply::Nothing  ? nullptr
                                     : expected == Reply::Cached ? fromCache
                                                                 : fromDownload)
          << test.policy << " " << static_cast<int>(test.cache) << yields;
      EXPECT_EQ(provider->downloads.size(), test.downloads ? 1U : 0U);
    }
  }
}

TEST_F(ALookup, SaysWhyItTrustsTheCacheOrNot) {
  const std::string download =
      "-[KVRAgent getWarrantyUsingPolicy:serialNumber:withReply:]: shouldDownloadWarranty: ";
  struct Case {
    std::function<void(FakeWarrantyProvider&)> change;
    std::uint64_t policy;
    std::vector<std::string> lines;
  };
  const std::string valid =
      "cached warranty is for locale ('en_US') and version ('2') match system, consider it valid";
  const std::string examine = "Default policy query: cached warranty is valid, examine expiration date";
  const std::string invalid = "Default policy query: cached warranty is invalid, refresh it";
  const auto now = simulated.clock.now();
  const Case cases[] = {
      {[](auto& p) { p.cached = nullptr; }, 1, {"no cached warranty : SN"}},
      {[](auto& p) { p.version.reset(); },
       0,
       {"Has cached warranty : SN",
        "cached warranty is of outdated version '(null)', current version is '2', consider it invalid",
        invalid}},
      {[](auto& p) { p.locale = "fr_FR"; },
       0,
       {"Has cached warranty : SN",
        "cached warranty is for locale 'fr_FR', system is now in 'en_US', consider it invalid", invalid}},
      {[](auto& p) { p.locale.reset(); },
       2,
       {"Has cached warranty : SN",
        "cached warranty is for locale '(null)', system is now in 'en_US', consider it invalid"}},
      {[](auto& p) { p.signedIn = false; },
       0,
       {"Has cached warranty : SN", "user is signed out of Nimbra, cached warranty not allowed", invalid}},
      {[&](auto& p) { p.lastUpdated = now - 3600; },
       0,
       {"Has cached warranty : SN", valid, examine, "warranty valid for 82800.00 seconds"}},
      {[&](auto& p) { p.lastUpdated = now - 86400.5; },
       0,
       {"Has cached warranty : SN", valid, examine,
        "warranty validity expired 0.50 seconds ago, refresh it"}},
      {[](auto& p) { p.lastUpdated.reset(); },
       0,
       {"Has cached warranty : SN", valid, examine, "warranty validity expired, refresh it"}},
      {[](auto&) {}, 9, {"Has cached warranty : SN", valid}},
  };
  for (const auto& test : cases) {
    *provider = FakeWarrantyProvider();
    provider->cached = fromCache;
    test.change(*provider);
    simulated.log.clear();
    const bool answered = lookUp(test.policy) != nullptr;
    std::vector<std::string> expected = {format("getting warranty using policy SN: %lu", test.policy)};
    expected.insert(expected.end(), test.lines.begin(), test.lines.end());
    expected.push_back(download + (provider->downloads.empty() ? "0" : "1"));
    expected.emplace_back("getWarrantyUsingPolicy completionBlock SN : 0");
    EXPECT_EQ(simulated.log.texts(), expected);
    (void)answered;
  }
}

TEST_F(ALookup, RefusesWhatIsNoSerialNumber) {
  provider->cached = fromCache;
  provider->lastUpdated = simulated.clock.now();
  for (const auto& serialNumber :
       {std::optional<std::string>(), std::optional<std::string>(""),
        std::optional(std::string(100'000, 'x')), std::optional<std::string>("a/../b"),
        std::optional(std::string("A\0B", 3)), std::optional<std::string>("A\nB")}) {
    simulated.log.clear();
    EXPECT_EQ(lookUp(2, serialNumber), nullptr);
    EXPECT_EQ(simulated.log.texts(LogLevel::Error).size(), 1U);
    EXPECT_EQ(simulated.log.lines().size(), 1U);
  }
  EXPECT_THAT(provider->downloads, IsEmpty());
  EXPECT_EQ(lookUp(1, "Ünicode serial-1.2"), fromCache);
}

}  // namespace
}  // namespace kvr
