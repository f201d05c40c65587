#include "platform/PropertyList.h"
#include "unit/SimulatedTest.h"
#include "warranty/KVRServerVersionUtilities.h"
#include "warranty/WarrantyKeys.h"

namespace kvr {
namespace {

using Utilities = KVRServerVersionUtilities;

Value pairOf(Value low, Value high) {
  return Value::Dictionary{{"LowServerVersion", std::move(low)}, {"HighServerVersion", std::move(high)}};
}

std::string asset(const Value& tree) { return *writePropertyList(tree, PropertyListEncoding::XML); }

class TheVersionNegotiation : public SimulatedTest {
 protected:
  TheVersionNegotiation() { configure(simulated); }

  static void configure(SimulatedPlatform& platform) {
    platform.preferences.registerDefaults(
        {{preference::kLowServerVersion, 2},
         {preference::kHighServerVersion, 3},
         {preference::kServerVersionURL, "https://assets.example/kvrV2.plist"}});
  }
  /// What `supported` answers, run to its end.
  static bool supported(SimulatedPlatform& world) {
    std::optional<bool> answer;
    Utilities::serverVersionSupported(
        world.platform, Utilities::BoolCompletion(world.log, "test", [&](bool yes) { answer = yes; }));
    world.queues.run();
    return answer.value();
  }
  static bool highEnabled(SimulatedPlatform& world, std::uint64_t policy) {
    std::optional<bool> answer;
    Utilities::isHighServerVersionFeaturesetEnabled(
        world.platform, policy,
        Utilities::BoolCompletion(world.log, "test", [&](bool yes) { answer = yes; }));
    world.queues.run();
    return answer.value();
  }
  Value cache() const { return simulated.preferences.objectForKey(preference::kServerVersionCache); }
};

TEST_F(TheVersionNegotiation, SharesTheVersionsThatBothSidesSpeak) {
  struct Case {
    Value server;
    bool supported;
    bool high;
    const char* error;
  };
  const Case cases[] = {
      {pairOf(2, 3), true, true, ""},
      {pairOf(3, 4), true, true, ""},
      {pairOf(1, 2), true, false, ""},
      {pairOf("2", "3"), true, true, ""},
      {pairOf("3rd", "x"), true, true, ""},
      {pairOf(3.0, 9), true, true, ""},
      {pairOf(1, 5), false, false, ""},
      {pairOf(Value::Array{}, true), false, false, ""},
      {Value::Dictionary{{"LowServerVersion", 2}}, false, false,
       "Server version dictionary missing key 'HighServerVersion'"},
      {Value::Dictionary{{"HighServerVersion", 3}}, false, false,
       "Server version dictionary missing key 'LowServerVersion'"},
      {"text", false, false, "Incorrect serverDictionary format"},
  };
  for (const auto& test : cases) {
    SimulatedPlatform world;
    configure(world);
    world.preferences.setObject(test.server, preference::kServerVersionOverride);
    EXPECT_EQ(supported(world), test.supported) << describe(test.server);
    EXPECT_EQ(highEnabled(world, Utilities::kDefault), test.high) << describe(test.server);
    EXPECT_EQ(Utilities::isHighServerVersionFeaturesetEnabled(world.platform), test.high);
    EXPECT_EQ(world.preferences.objectForKey(preference::kServerVersionCache), test.server);
    EXPECT_THAT(world.http.requests(), ::testing::IsEmpty());
    if (*test.error != '\0') {
      EXPECT_THAT(world.log.texts(LogLevel::Error), ::testing::Each(test.error));
      EXPECT_FALSE(world.log.texts(LogLevel::Error).empty());
    }
    EXPECT_THAT(world.faults(), ::testing::IsEmpty());
  }
}

TEST_F(TheVersionNegotiation, TakesTheServersPairFromThePolicysSources) {
  // Which source wins shows in the answer: only the cache {1, 2} lacks the high version, only the asset {3,
  // 9} is stored anew.
  const Value cached = pairOf(1, 2);
  const Value published = pairOf(3, 9);
  const Value client = pairOf(2, 3);
  struct Case {
    std::uint64_t policy;
    bool hasCache, hasAsset;
    bool high;
    std::size_t requests;
    Value cacheAfter;
  };
  const Case cases[] = {
      {Utilities::kDefault, true, true, false, 0, cached},
      {Utilities::kDefault, false, true, true, 1, published},
      {Utilities::kDefault, false, false, true, 1, {}},
      {7, true, true, false, 0, cached},
      {7, false, true, true, 1, published},
      {Utilities::kCacheOnly, true, true, false, 0, cached},
      {Utilities::kCacheOnly, false, true, true, 0, {}},
      {Utilities::kRefresh, true, true, true, 1, published},
      {Utilities::kRefresh, true, false, false, 1, cached},
      {Utilities::kRefresh, false, false, true, 1, client},
  };
  for (const auto& test : cases) {
    SimulatedPlatform world;
    configure(world);
    if (test.hasCache) world.preferences.setObject(cached, preference::kServerVersionCache);
    if (test.hasAsset) world.http.respond(404, asset(published));  // the status plays no part
    EXPECT_EQ(highEnabled(world, test.policy), test.high) << test.policy << test.hasCache << test.hasAsset;
    EXPECT_EQ(world.http.requests().size(), test.requests) << test.policy << test.hasCache << test.hasAsset;
    EXPECT_EQ(world.preferences.objectForKey(preference::kServerVersionCache), test.cacheAfter);
    EXPECT_EQ(world.log.contains("Using Client version"),
              !test.hasCache && (!test.hasAsset || test.requests == 0));
    EXPECT_THAT(world.faults(), ::testing::IsEmpty());
  }
}

TEST_F(TheVersionNegotiation, AsksOnceMorePastTheCachesForAnAssetThatIsNoDictionary) {
  simulated.http.respond(200, asset(Value::Array{1}));
  simulated.http.respond(200, asset(pairOf(3, 3)));
  EXPECT_TRUE(supported(simulated));
  ASSERT_EQ(simulated.http.requests().size(), 2U);
  EXPECT_FALSE(simulated.http.requests()[0].uncached);
  EXPECT_TRUE(simulated.http.requests()[1].uncached);
  EXPECT_EQ(cache(), pairOf(3, 3));
  EXPECT_THAT(simulated.log.texts(LogLevel::Error),
              ::testing::ElementsAre("Incorrect format in response detected. retrying..."));
}

TEST_F(TheVersionNegotiation, GoesOnWithTheNextSourceAfterAnyFailedFetch) {
  const std::string url = "https://assets.example/kvrV2.plist";
  struct Case {
    std::function<void(SimulatedPlatform&)> script;
    std::size_t requests;
    std::string lastError;
  };
  const Case cases[] = {
      {[](auto& world) {
         world.http.fail(Error{"http", 7, "refused"});
       },
       1,
       "Failed to fetch plist data from URL '" + url + "' with error: Error Domain=http Code=7 \"refused\""},
      {[](auto& world) { world.http.respond(200, "<html>"); }, 1,
       "Error serializing plist file from URL '" + url + "'"},
      {[](auto& world) {
         world.http.respond(200, "(1)");
         world.http.respond(200, "(2)");
       },
       2,
       "Incorrect format in response detected from URL '" + url +
           "'. Response: (2). Aborting without retry."},
      {[](auto& world) { world.preferences.setObject("file:///nowhere", preference::kServerVersionURL); }, 0,
       "Failed to fetch plist data from URL 'file:///nowhere'"},
      {[](auto& world) { world.preferences.setObject(7, preference::kServerVersionURL); }, 0,
       "Failed to fetch plist data from URL '7'"},
  };
  for (const auto& test : cases) {
    SimulatedPlatform world;
    configure(world);
    test.script(world);
    EXPECT_TRUE(supported(world)) << test.lastError;
    EXPECT_EQ(world.http.requests().size(), test.requests) << test.lastError;
    EXPECT_THAT(world.log.texts(LogLevel::Error).back(), ::testing::StartsWith(test.lastError));
    EXPECT_EQ(world.preferences.objectForKey(preference::kServerVersionCache), pairOf(2, 3));
    EXPECT_THAT(world.faults(), ::testing::IsEmpty());
  }
}

TEST_F(TheVersionNegotiation, ReadsTheAssetFromAFileToo) {
  simulated.files.put("/assets/versions.plist", asset(pairOf(3, 4)));
  simulated.preferences.setObject("file:///assets/versions.plist", preference::kServerVersionURL);
  EXPECT_TRUE(supported(simulated));
  EXPECT_EQ(cache(), pairOf(3, 4));
}

TEST_F(TheVersionNegotiation, RemovesACacheThatIsNoDictionary) {
  simulated.preferences.setObject("3", preference::kServerVersionCache);
  EXPECT_TRUE(Utilities::isHighServerVersionFeaturesetEnabled(simulated.platform));
  EXPECT_EQ(cache(), Value());
  EXPECT_THAT(simulated.log.texts(LogLevel::Error),
              ::testing::ElementsAre("Incorrect format stored in server version cache. Removing it."));
}

TEST_F(TheVersionNegotiation, TellsInTheLogHowItCameToItsAnswer) {
  simulated.http.respond(200, asset(pairOf(3, 4)));
  EXPECT_TRUE(supported(simulated));
  EXPECT_THAT(simulated.log.texts(),
              ::testing::ElementsAre(
                  " Server lookup policy:2",
                  "Caching Server version  {HighServerVersion = 4; LowServerVersion = 3; }",
                  "Server version  {HighServerVersion = 4; LowServerVersion = 3; }",
                  "Server versions '{(3, 4)}'", "Client versions '{(2, 3)}'", "clientAndServerSet '{(3)}'",
                  "Server version supported by client version - '{(3)}'"));
}

}  // namespace
}  // namespace kvr
