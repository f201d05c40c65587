#include "core/warranty/KVRServerVersionUtilities.h"
#include "core/warranty/WarrantyKeys.h"
#include "unit/SimulatedTest.h"

namespace kvr {
namespace {

using Utilities = KVRServerVersionUtilities;

Value pairOf(Value low, Value high) {
  return Dictionary{{"LowServerVersion", std::move(low)}, {"HighServerVersion", std::move(high)}};
}

std::string asset(const Value& tree) { return *writePropertyList(tree, PropertyListEncoding::XML); }

/// A client that supports versions 2 and 3, and its results.
struct Client : SimulatedPlatform {
  Client() {
    preferences.registerDefaults({{preference::kLowServerVersion, 2},
                                  {preference::kHighServerVersion, 3},
                                  {preference::kServerVersionURL, "https://assets.example/kvrV2.plist"}});
  }
  bool supported() {
    return answerTo([&](auto reply) { Utilities::serverVersionSupported(platform, std::move(reply)); });
  }
  bool highEnabled(std::uint64_t policy) {
    return answerTo([&](auto reply) {
      Utilities::isHighServerVersionFeaturesetEnabled(platform, policy, std::move(reply));
    });
  }
  bool answerTo(const std::function<void(Utilities::BoolCompletion)>& ask) {
    std::optional<bool> answer;
    ask(Utilities::BoolCompletion(log, "test", [&](bool yes) { answer = yes; }));
    queues.run();
    return answer.value();
  }
  Value cache() const { return preferences.objectForKey(preference::kServerVersionCache); }
};

TEST(TheVersionNegotiation, SharesTheVersionsThatBothSidesSpeak) {
  const Value low = Dictionary{{"LowServerVersion", 2}};
  const std::tuple<Value, bool, bool, std::vector<std::string>> cases[] = {
      {pairOf(3, 4), true, true, {}},
      {pairOf(1, 2), true, false, {}},
      {pairOf("2", "3"), true, true, {}},
      {pairOf("3rd", "x"), true, true, {}},
      {pairOf(3.0, 9), true, true, {}},
      {pairOf(1, 5), false, false, {}},
      {pairOf(Array{}, true), false, false, {}},
      {low, false, false, {"Server version dictionary missing key 'HighServerVersion'"}},
      {"text", false, false, {"Incorrect serverDictionary format"}}};
  for (const auto& [server, supported, high, errors] : cases) {
    SCOPED_TRACE(describe(server));
    Client client;
    client.preferences.setObject(server, preference::kServerVersionOverride);
    EXPECT_EQ(client.supported(), supported);
    EXPECT_EQ(client.log.texts(LogLevel::Error), errors);
    EXPECT_EQ(client.highEnabled(ServerLookupPolicy::kDefault), high);
    EXPECT_EQ(Utilities::isHighServerVersionFeaturesetEnabled(client.platform), high);
    EXPECT_EQ(client.cache(), server);
    EXPECT_THAT(client.http.requests(), IsEmpty());
    EXPECT_THAT(client.faults(), IsEmpty());
  }
}

TEST(TheVersionNegotiation, TakesTheServersPairFromThePolicysSources) {
  // The results show which source was used: only the cached pair lacks the high version, and only the asset's
  // pair is stored again.
  const Value cached = pairOf(1, 2);
  const Value published = pairOf(3, 9);
  const std::tuple<std::uint64_t, bool, bool, bool, std::size_t, Value> cases[] = {
      {ServerLookupPolicy::kDefault, true, true, false, 0, cached},
      {ServerLookupPolicy::kDefault, false, true, true, 1, published},
      {ServerLookupPolicy::kDefault, false, false, true, 1, {}},
      {7, true, true, false, 0, cached},
      {7, false, true, true, 1, published},
      {ServerLookupPolicy::kCacheOnly, true, true, false, 0, cached},
      {ServerLookupPolicy::kCacheOnly, false, true, true, 0, {}},
      {ServerLookupPolicy::kRefresh, true, true, true, 1, published},
      {ServerLookupPolicy::kRefresh, true, false, false, 1, cached},
      {ServerLookupPolicy::kRefresh, false, false, true, 1, pairOf(2, 3)}};
  for (const auto& [policy, hasCache, hasAsset, high, requests, cacheAfter] : cases) {
    SCOPED_TRACE(format("%d %d %d", policy, hasCache, hasAsset));
    Client client;
    if (hasCache) client.preferences.setObject(cached, preference::kServerVersionCache);
    if (hasAsset) client.http.respond(404, asset(published));  // the status does not matter
    EXPECT_EQ(client.highEnabled(policy), high);
    EXPECT_EQ(client.http.requests().size(), requests);
    EXPECT_EQ(client.cache(), cacheAfter);
    EXPECT_EQ(client.log.contains("Using Client version"), !hasCache && (!hasAsset || requests == 0));
    EXPECT_THAT(client.faults(), IsEmpty());
  }
}

TEST(TheVersionNegotiation, GoesOnAfterAnyFailedFetchAndAsksOnceMoreForAnAssetThatIsNoDictionary) {
  const std::string url = "https://assets.example/kvrV2.plist";
  const std::string from = " from URL '" + url + "'", failed = "Failed to fetch plist data";
  const Value client = pairOf(2, 3);
  const std::tuple<Value, std::vector<std::string>, Value, std::string> cases[] = {
      {url, {"(1)", asset(pairOf(3, 3))}, pairOf(3, 3), "Incorrect format in response detected. retrying..."},
      {url,
       {"(1)", "(2)"},
       client,
       "Incorrect format in response detected" + from + ". Response: (2). Aborting without retry."},
      {url, {"<html>"}, client, "Error serializing plist file" + from},
      {url, {}, client, failed + from + " with error: Error Domain=http Code=7 \"refused\""},
      {"file:///nowhere", {}, client, failed + " from URL 'file:///nowhere'"},
      {7, {}, client, failed + " from URL '7'"}};
  for (const auto& [address, responses, cacheAfter, lastError] : cases) {
    SCOPED_TRACE(lastError);
    Client world;
    world.preferences.setObject(address, preference::kServerVersionURL);
    for (const auto& response : responses) world.http.respond(200, response);
    if (responses.empty()) world.http.fail(Error{"http", 7, "refused"});
    EXPECT_TRUE(world.supported());
    EXPECT_THAT(world.log.texts(LogLevel::Error).back(), ::testing::StartsWith(lastError));
    EXPECT_EQ(world.cache(), cacheAfter);
    const auto& sent = world.http.requests();
    for (std::size_t i = 0; i < sent.size(); ++i) EXPECT_EQ(sent[i].uncached, i > 0);
    EXPECT_LE(sent.size(), 2U);
    EXPECT_THAT(world.faults(), IsEmpty());
  }
}

TEST(TheVersionNegotiation, HeedsTheVersionsOfAnAssetWhateverElseItHolds) {
  const auto assetWith = [](Value low, const Value& more) {
    return Dictionary{{"LowServerVersion", std::move(low)}, {"HighServerVersion", "9"}, {"more", more}};
  };
  const Array manyTexts(100, std::string(100'000, 'x'));
  const auto binary = [](const Value& tree) {
    return *writePropertyList(tree, PropertyListEncoding::Binary);
  };
  const std::string deep(1000, '('), end(1000, ')');
  std::string many;
  for (int i = 0; i < 200'000; ++i) many += "1,";
  const Value large = assetWith("8", std::string(1'000'000, 'x'));
  const Value shared = assetWith("8", Array(10, std::string(100'000, 'x')));
  const std::tuple<std::string, Value, bool> cases[] = {
      {asset(large), large, false},
      {binary(shared), shared, false},
      {binary(assetWith("8", manyTexts)), pairOf(8, 9), false},
      {binary(assetWith("3", manyTexts)), pairOf(3, 9), true},
      {binary(assetWith(manyTexts, 1)), pairOf(Array{}, 9), false},
      {"{ LowServerVersion = 8; more = " + deep + end + "; HighServerVersion = 9; }", pairOf(8, 9), false},
      // As deep as can be read, and too deep for an entry of another list.
      {"{ LowServerVersion = 8; more = " + deep.substr(489) + end.substr(489) + "; HighServerVersion = 9; }",
       pairOf(8, 9), false},
      // More values than the preferences should hold.
      {"{ LowServerVersion = 8; more = (" + many + "1); HighServerVersion = 9; }", pairOf(8, 9), false}};
  for (const auto& [body, cacheAfter, supported] : cases) {
    SCOPED_TRACE(body.substr(0, 80));
    ASSERT_LE(body.size(), std::size_t{1} << 20U);
    for (const bool fromFile : {false, true}) {
      Client client;
      if (fromFile) client.preferences.setObject("file:///asset", preference::kServerVersionURL);
      client.files.put("/asset", body);
      client.http.respond(200, body);
      EXPECT_EQ(client.supported(), supported);
      EXPECT_TRUE(client.cache() == cacheAfter) << describe(client.cache()).substr(0, 200);
      EXPECT_EQ(client.log.contains("holds more than can be kept: only its versions are"),
                !cacheAfter.contains("more"));
      EXPECT_THAT(client.faults(), IsEmpty());
    }
  }
}

TEST(TheVersionNegotiation, ReadsTheAssetFromAFileTooAndRemovesACacheThatIsNoDictionary) {
  Client client;
  client.files.put("/assets/versions.plist", asset(pairOf(3, 4)));
  client.preferences.setObject("file:///assets/versions.plist", preference::kServerVersionURL);
  EXPECT_TRUE(client.supported());
  EXPECT_EQ(client.cache(), pairOf(3, 4));

  client.preferences.setObject("3", preference::kServerVersionCache);
  EXPECT_TRUE(Utilities::isHighServerVersionFeaturesetEnabled(client.platform));
  EXPECT_EQ(client.cache(), Value());
  EXPECT_THAT(client.log.texts(LogLevel::Error),
              ElementsAre("Incorrect format stored in server version cache. Removing it."));
}

}  // namespace
}  // namespace kvr
