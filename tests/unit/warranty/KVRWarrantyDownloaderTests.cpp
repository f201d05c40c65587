#include "core/outreach/WarrantyDownloads.h"
#include "core/scheduling/SchedulingKeys.h"
#include "core/warranty/CacheMetadata.h"
#include "platform/codec/JSON.h"
#include "unit/CoverageWorld.h"

namespace kvr {
namespace {

struct ADownload : CoverageTest {
  struct Answer {
    bool success;
    KVRWarrantyRef warranty;
  };
  Answer download(const std::optional<std::string>& serialNumber) {
    std::vector<Answer> answers;
    const DownloadCompletion completion(world.log, "test", [&](bool success, const KVRWarrantyRef& warranty) {
      answers.push_back({success, warranty});
    });
    newWarrantyDownloader(world.platform, "com.example.client")
        ->downloadWarrantyForSerialNumber(serialNumber, completion);
    world.queues.runUntil([&] { return !answers.empty(); });
    EXPECT_EQ(answers.size(), 1U);
    return answers.at(0);
  }
  /// Makes the service answer with this conversion date.
  void converts(const std::string& epoch) {
    world.coverage = [epoch](auto&) {
      return HTTPResponse{200, "{\"zubOfferConversionDate\":" + epoch + "}", {}};
    };
  }
  std::optional<Date> scheduledDate() {
    return world.preferences.dateForKey(preference::kConversionOutreachScheduledDate);
  }
  std::string cachedFile(const std::string& serialNumber) const {
    return "/home/user/Library/Application Support/com.tarsil.Kavrel/" + sha256Hash(serialNumber) +
           "_Warranty.plist";
  }
};

TEST_F(ADownload, GoesOnceToTheEndpointOfItsDeviceForItsClient) {
  for (const auto& [serialNumber, path] : {std::pair(CoverageWorld::kLocal, "/api/v3/coverage/summary"),
                                           {"WATCH", "/api/v2/coverage/summary"}}) {
    world.http.clearRequests();
    EXPECT_TRUE(download(serialNumber).success);
    ASSERT_EQ(world.http.requests().size(), 2U) << "the version asset, then the coverage";
    const auto& request = world.http.requests()[1].request;
    EXPECT_EQ(request.url, std::string("https://coverage.tarsil.example") + path);
    EXPECT_FALSE(request.followsRedirects);
    EXPECT_EQ(request.sourceApplicationBundleID, "com.example.client");
  }
}

TEST_F(ADownload, WaitsAMinuteForTheVersionsAndHalfOfOneForTheCoverage) {
  world.http.ignore();
  world.coverage = nullptr;
  EXPECT_FALSE(download("WATCH").success);
  EXPECT_EQ(world.clock.elapsed(), 60 + 30);
}

TEST_F(ADownload, LogsEachStepInItsOrder) {
  EXPECT_TRUE(download("WATCH").success);
  const auto path = cachedFile("WATCH");
  EXPECT_THAT(*world.files.get(path), ::testing::StartsWith("<?xml"));
  auto lines = world.log.texts(LogLevel::Default);
  std::erase_if(lines, [](const std::string& line) { return line.starts_with("default device"); });
  EXPECT_THAT(
      lines,
      ElementsAre(
          "-[KVRWarrantyDownloader downloadWarrantyForSerialNumber:completionHandler:]: WATCH",
          " Server lookup policy:2", HasSubstr("Caching Server version  {"), HasSubstr("Server version  {"),
          "Server versions '{(2, 3)}'", "Client versions '{(2, 3)}'", "clientAndServerSet '{(2, 3)}'",
          "Server version supported by client version - '{(2, 3)}'",
          "WATCH : warranty download attempt (0/2)", "storeLocale 143441",
          "Retrying request:", HasSubstr("Headers: {X-Tarsil-Vornic-Token = \"token\""),
          HasSubstr("Body: {\"locale\":\"en_US\""), "load warranty status: 200 : {covered = 1; }",
          "downloaded warranty: {covered = 1; }", "+[KVRWarranty warrantyWithDictionary:serialNumber:] : 1",
          "+[KVRWarranty cachedWarrantyForSerialNumber:] : warrantyPath : " + path,
          "caching warranty for locale: 'en_US', version: 2", "-[KVRWarranty cacheWarranty:] -> " + path));
}

TEST_F(ADownload, TriesAgainAfter401OnlyAndRenewsTheTokenThen) {
  const std::tuple<std::vector<int>, bool, std::size_t> cases[] = {
      {{200}, true, 0},  {{401, 200}, true, 1},  {{401, 401, 200}, true, 2}, {{401, 401, 401}, false, 2},
      {{500}, false, 0}, {{401, 503}, false, 1}, {{302}, false, 0},          {{204}, false, 0}};
  for (const auto& [statuses, success, renewals] : cases) {
    std::vector<int> left = statuses;
    world.coverage = [&](const HTTPRequest&) {
      const HTTPResponse response{left.front(), "{}", {}};
      left.erase(left.begin());
      return response;
    };
    world.accounts.renewals.clear();
    world.log.clear();
    EXPECT_EQ(download("WATCH").success, success) << statuses.front();
    EXPECT_THAT(left, IsEmpty()) << statuses.front();
    EXPECT_EQ(world.accounts.renewals.size(), renewals);
    for (std::size_t attempt = 0; attempt < statuses.size(); ++attempt) {
      EXPECT_EQ(world.log.count(format("WATCH : warranty download attempt (%d/2)", attempt)), 1U);
    }
    EXPECT_EQ(world.log.count("kvragent failed to load warranty"), success ? 0U : 1U);
  }
}

TEST_F(ADownload, ComplainsAboutWhatIsNoJSONOnlyInASuccessfulAnswer) {
  for (const int status : {200, 401, 503}) {
    world.log.clear();
    world.coverage = [status](auto&) { return HTTPResponse{status, "<html>", {}}; };
    EXPECT_FALSE(download("WATCH").success);
    EXPECT_EQ(world.log.contains("The coverage service's answer is no JSON: "), status == 200) << status;
    EXPECT_EQ(world.log.texts(LogLevel::Error).size(), status == 200 ? 2U : 1U);
  }
}

TEST_F(ADownload, LeavesTheCacheAloneWhenItFails) {
  ASSERT_TRUE(download("WATCH").success);
  const auto fileBefore = world.files.get(cachedFile("WATCH"));
  const auto dateKey = CacheMetadata("WATCH").lastUpdatedDateKey;
  const auto dateBefore = world.preferences.objectForKey(dateKey);
  ASSERT_TRUE(fileBefore && dateBefore.isDate());
  const auto expectFailure = [&](const std::string& line, const std::function<void()>& cause) {
    world.reset();
    world.queues.advance(10);
    cause();
    world.log.clear();
    const auto answer = download("WATCH");
    EXPECT_FALSE(answer.success || answer.warranty) << line;
    EXPECT_EQ(world.files.get(cachedFile("WATCH")), fileBefore) << line;
    EXPECT_EQ(world.preferences.objectForKey(dateKey), dateBefore) << line;
    EXPECT_EQ(world.log.count(line), 1U) << line;
  };
  const std::string failed = "kvragent failed to load warranty";
  expectFailure("Warranty download skipped server due to server version", [&] {
    world.preferences.setObject(Dictionary{{"LowServerVersion", 8}, {"HighServerVersion", 9}},
                                preference::kServerVersionOverride);
  });
  expectFailure("Unable to load sign request, failing warranty download",
                [&] { world.accounts.primary.reset(); });
  expectFailure(failed, [&] {
    world.coverage = [](auto&) { return HTTPResponse{200, {}, Error{"http", 0, "too large"}}; };
  });
  expectFailure(failed, [&] { world.coverage = nullptr; });
  for (const std::string& body :
       {std::string("<html>"), std::string("[1]"), "{\"a\":" + std::string(512, '[')}) {
    expectFailure(failed, [&] { world.coverage = [=](auto&) { return HTTPResponse{200, body, {}}; }; });
  }
  for (const Value& url : {Value("gopher://x"), Value(7), Value("file:///none")}) {
    expectFailure(failed, [&] { world.preferences.setObject(url, preference::kWearablesWarrantyURL); });
  }
}

TEST_F(ADownload, AnswersWhatTheCacheCannotHoldAndLeavesTheOldFile) {
  world.coverage = [](auto&) { return HTTPResponse{200, R"({"x":null})", {}}; };
  EXPECT_TRUE(download("WATCH").success);
  const auto found = world.files.stamp("/home/user/Library/Application Support/com.tarsil.Kavrel");
  EXPECT_TRUE(!found && found.error().code == EISDIR) << "the cache's directory is made first";
  world.reset();
  ASSERT_TRUE(download("WATCH").success);
  const auto fileBefore = world.files.get(cachedFile("WATCH"));
  const auto dateKey = CacheMetadata("WATCH").lastUpdatedDateKey;
  for (const char* unwritable : {R"({"x":null})", R"({"x":"\u0000"})", R"({"x":"\uffff"})"}) {
    const auto dateBefore = world.preferences.objectForKey(dateKey);
    world.queues.advance(10);
    world.coverage = [&](auto&) { return HTTPResponse{200, unwritable, {}}; };
    EXPECT_EQ(download("WATCH").warranty->dictionaryRepresentation(), *readJSON(unwritable));
    EXPECT_EQ(world.files.get(cachedFile("WATCH")), fileBefore);
    EXPECT_NE(world.preferences.objectForKey(dateKey), dateBefore) << "the date moves on";
  }
}

TEST_F(ADownload, SchedulesAConversionOutreachOnceThoughNothingCanBeStored) {
  converts("1700000000");
  world.files.setWriteFault(Error{"files", ENOSPC, "no space"});
  for (int round = 0; round < 3; ++round) EXPECT_TRUE(download("WATCH").success);
  EXPECT_EQ(world.log.count("scheduling conversion outreach 2023-11-14 22:13:20 +0000"), 1U);
  EXPECT_TRUE(world.log.contains("is scheduled, which still cannot be stored"));
}

TEST_F(ADownload, TakesANegativeConversionDateForOneInTheFarFuture) {
  converts("-1");
  EXPECT_TRUE(download("WATCH").success);
  EXPECT_EQ(scheduledDate(), Date{18'446'744'073'709'551.0});
  world.queues.advance(30 * kDay);
  EXPECT_FALSE(world.log.contains("for conversion outreach"));
  converts("1900000000");
  EXPECT_TRUE(download("WATCH").success);
  EXPECT_EQ(scheduledDate(), Date{1'900'000'000});
}

TEST_F(ADownload, ReadsALocalFileOrItsVariantForTheDeviceInTheServicesPlace) {
  world.preferences.setObject("file:///data/w%20x.plist", preference::kWearablesWarrantyURL);
  world.files.put("/data/w x.plist", "{ covered = YES; }");
  EXPECT_TRUE(download("WATCH").warranty->covered());
  EXPECT_TRUE(world.log.contains("loading warranty from: file:///data/w%20x.plist"));

  world.files.put("/data/w x.WATCH.plist", "{ covered = NO; quorURL = v; }");
  EXPECT_EQ(download("WATCH").warranty->quorURL(), Value("v"));
  EXPECT_TRUE(world.log.contains("loading warranty from: file:///data/w%20x.WATCH.plist"));

  world.files.put("/data/w x.WATCH.plist", "");
  EXPECT_TRUE(download("WATCH").warranty->covered()) << "an empty variant counts for nothing";
  world.files.put("/data/w x.WATCH.plist", "{ half");
  EXPECT_FALSE(download("WATCH").success);
  EXPECT_TRUE(world.log.contains("Error serializing plist file from URL 'file:///data/w%20x.plist': "));
  for (const std::size_t size : {std::size_t{64} << 20U, (std::size_t{64} << 20U) + 1}) {
    std::string variant = "{ quorURL = v; } //";
    variant.resize(size, ' ');
    world.files.put("/data/w x.WATCH.plist", variant);
    world.log.clear();
    EXPECT_EQ(download("WATCH").success, size == std::size_t{64} << 20U);
    EXPECT_FALSE(world.log.contains("loading warranty from: file:///data/w%20x.plist"));
  }
  EXPECT_TRUE(world.log.contains("URL 'file:///data/w%20x.WATCH.plist' cannot be read: "));
  world.files.setReadFault("/data/w x.WATCH.plist", Error{"files", EACCES, "denied"});
  EXPECT_TRUE(download("WATCH").warranty->covered());
  EXPECT_TRUE(world.log.contains("URL 'file:///data/w%20x.WATCH.plist' cannot be read: "));

  world.files.put("/secret.plist", "{ quorURL = secret; }");
  for (const auto& noName :
       {std::string("/../../../secret"), std::string("A\0B", 3), std::string(256, 'x')}) {
    EXPECT_TRUE(download(noName).warranty->covered()) << "no way out of the directory";
    EXPECT_TRUE(world.log.contains("the serial number cannot be a part of a file name"));
  }
  world.files.erase("/data/w x.plist");
  EXPECT_FALSE(download(std::nullopt).success);
  EXPECT_TRUE(world.log.contains("URL 'file:///data/w%20x.plist' contains no plist data"));
  world.preferences.setObject("file:///data/plain", preference::kWearablesWarrantyURL);
  world.files.put("/data/plain.WATCH.", "{ quorURL = plain; }");
  EXPECT_EQ(download("WATCH").warranty->quorURL(), Value("plain"));
  for (const auto& sent : world.http.requests()) EXPECT_THAT(sent.request.url, HasSubstr("/kvrV2.plist"));
}

}  // namespace
}  // namespace kvr
