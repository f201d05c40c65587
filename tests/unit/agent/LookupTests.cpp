#include "core/agent/KVRAgent.h"
#include "core/agent/KVRAgentDefaultWarrantyProvider.h"
#include "core/warranty/CacheMetadata.h"
#include "unit/SimulatedTest.h"

namespace kvr {
namespace {

/// A warranty provider whose inputs, except version and locale, are plain fields.
struct FakeWarrantyProvider : KVRAgentDefaultWarrantyProvider {
  using KVRAgentDefaultWarrantyProvider::KVRAgentDefaultWarrantyProvider;

  void downloadWarrantyForSerialNumber(const std::string&, DownloadCompletion handler) override {
    ++facts.downloads;
    handler(facts.downloaded != nullptr, facts.downloaded);
  }
  KVRWarrantyRef cachedWarrantyForSerialNumber(const std::string&) override { return facts.cached; }
  std::optional<Date> lastUpdatedDateForSerialNumber(const std::string&) override {
    return facts.lastUpdated;
  }
  double cachedWarrantyValidityDuration() override { return 86400; }
  bool isSignedInToNimbra() override { return facts.signedIn; }

  struct Facts {
    KVRWarrantyRef cached;
    KVRWarrantyRef downloaded;
    std::optional<Date> lastUpdated;
    Value version = "2";
    Value locale = "en_US";
    bool signedIn = true;
    std::size_t downloads = 0;
  } facts;
};

struct ALookup : SimulatedTest {
  ALookup() { world.clock.set(Date{1'800'000'000}); }
  KVRWarrantyRef warranty(const char* mark) {
    return KVRWarranty::initWithDictionary(world.platform, Dictionary{{"quorURL", mark}});
  }
  KVRWarrantyRef lookUp(std::uint64_t policy, const std::optional<std::string>& serialNumber = "SN") {
    const CacheMetadata stored(serialNumber.value_or(""));
    world.preferences.setObject(facts.version, stored.versionKey);
    world.preferences.setObject(facts.locale, stored.localeKey);
    std::optional<KVRWarrantyRef> answer;
    agent->getWarrantyUsingPolicy(
        policy, serialNumber,
        KVRAgent::WarrantyReply(world.log, "test", [&](const KVRWarrantyRef& it) { answer = it; }));
    return answer.value();
  }

  const std::shared_ptr<FakeWarrantyProvider> provider =
      std::make_shared<FakeWarrantyProvider>(world.platform, "client");
  FakeWarrantyProvider::Facts& facts = provider->facts;
  const std::shared_ptr<KVRAgent> agent = std::make_shared<KVRAgent>(world.platform, provider, nullptr);
  const KVRWarrantyRef fromCache = warranty("cache");
  const KVRWarrantyRef fromDownload = warranty("download");
};

TEST_F(ALookup, DecidesBetweenCacheAndDownload) {
  enum class Cache { Missing, Invalid, Stale, Undated, Fresh };
  const KVRWarrantyRef nothing;
  const std::tuple<std::uint64_t, Cache, bool, KVRWarrantyRef, KVRWarrantyRef> cases[] = {
      {0, Cache::Fresh, false, fromCache, fromCache},     {0, Cache::Stale, true, fromDownload, fromCache},
      {0, Cache::Undated, true, fromDownload, fromCache}, {0, Cache::Invalid, true, fromDownload, nothing},
      {0, Cache::Missing, true, fromDownload, nothing},   {1, Cache::Stale, false, fromCache, fromCache},
      {1, Cache::Invalid, false, nothing, nothing},       {1, Cache::Missing, false, nothing, nothing},
      {7, Cache::Stale, false, fromCache, fromCache},     {7, Cache::Missing, false, nothing, nothing},
      {2, Cache::Fresh, true, fromDownload, nothing},     {2, Cache::Missing, true, fromDownload, nothing}};
  for (const auto& [policy, cache, downloads, whenItYields, otherwise] : cases) {
    facts.cached = cache == Cache::Missing ? nullptr : fromCache;
    facts.version = cache == Cache::Invalid ? "1" : "2";
    // A cache exactly at the end of its validity is stale.
    const double age = cache == Cache::Stale ? 86400 : 3600;
    facts.lastUpdated = cache == Cache::Undated ? std::nullopt : std::optional(world.clock.now() - age);
    for (const bool yields : {true, false}) {
      facts.downloaded = yields ? fromDownload : nullptr;
      facts.downloads = 0;
      EXPECT_EQ(lookUp(policy), yields ? whenItYields : otherwise)
          << policy << " " << static_cast<int>(cache) << yields;
      EXPECT_EQ(facts.downloads, downloads ? 1U : 0U);
    }
  }
}

TEST_F(ALookup, SaysWhyItTrustsTheCacheOrNot) {
  const auto expect = [&](std::uint64_t policy, const std::function<void()>& change, bool downloads,
                          std::vector<std::string> lines) {
    facts = {};
    facts.cached = fromCache;
    change();
    world.log.clear();
    lookUp(policy);
    lines.insert(lines.begin(), format("getting warranty using policy SN: %lu", policy));
    lines.push_back(format(
        "-[KVRAgent getWarrantyUsingPolicy:serialNumber:withReply:]: shouldDownloadWarranty: %d", downloads));
    lines.emplace_back("getWarrantyUsingPolicy completionBlock SN : 0");
    EXPECT_EQ(world.log.texts(), lines);
  };
  const std::string has = "Has cached warranty : SN";
  const std::string valid =
      "cached warranty is for locale ('en_US') and version ('2') match system, consider it valid";
  const std::string examine = "Default policy query: cached warranty is valid, examine expiration date";
  const std::string invalid = "Default policy query: cached warranty is invalid, refresh it";
  const auto now = world.clock.now();
  expect(1, [&] { facts.cached = nullptr; }, false, {"no cached warranty : SN"});
  expect(0, [&] { facts.version = Value(); }, true,
         {has, "cached warranty is of outdated version '(null)', current version is '2', consider it invalid",
          invalid});
  expect(0, [&] { facts.version = 2; }, true,
         {has, "cached warranty is of outdated version '2', current version is '2', consider it invalid",
          invalid});
  expect(2, [&] { facts.locale = Value(); }, true,
         {has, "cached warranty is for locale '(null)', system is now in 'en_US', consider it invalid"});
  expect(2, [&] { facts.locale = Array{"en_US"}; }, true,
         {has, "cached warranty is for locale '(en_US)', system is now in 'en_US', consider it invalid"});
  expect(0, [&] { facts.signedIn = false; }, true,
         {has, "user is signed out of Nimbra, cached warranty not allowed", invalid});
  expect(0, [&] { facts.lastUpdated = now - 3600; }, false,
         {has, valid, examine, "warranty valid for 82800.00 seconds"});
  expect(0, [&] { facts.lastUpdated = now - 86400.5; }, true,
         {has, valid, examine, "warranty validity expired 0.50 seconds ago, refresh it"});
  expect(0, [] {}, true, {has, valid, examine, "warranty validity expired, refresh it"});
  expect(9, [] {}, false, {has, valid});
}

TEST_F(ALookup, OfADeviceWithoutSerialNumberIsAnsweredWithNothing) {
  facts.cached = fromCache;
  facts.downloaded = fromDownload;
  EXPECT_EQ(lookUp(2, std::nullopt), nullptr);
  EXPECT_THAT(world.log.texts(LogLevel::Error), ElementsAre(HasSubstr("has no serial number")));
  EXPECT_EQ(facts.downloads, 0U);
}

}  // namespace
}  // namespace kvr
