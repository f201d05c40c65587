#include "platform/JSON.h"
#include "unit/CoverageWorld.h"
#include "warranty/CacheMetadata.h"
#include "warranty/KVRWarrantyDownloader.h"

namespace kvr {
namespace {

using ::testing::ElementsAre;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

struct Answer {
  bool success;
  KVRWarrantyRef warranty;
};

class ADownload : public ::testing::Test {
 protected:
  void TearDown() override {
    world.queues.run();
    EXPECT_THAT(world.faults(), IsEmpty());
  }

  Answer download(const std::optional<std::string>& serialNumber) {
    std::vector<Answer> answers;
    const auto downloader = std::make_shared<KVRWarrantyDownloader>(world.platform, "com.example.client");
    downloader->downloadWarrantyForSerialNumber(
        serialNumber,
        DownloadCompletion(world.log, "test", [&](bool success, const KVRWarrantyRef& warranty) {
          answers.push_back({success, warranty});
        }));
    world.queues.runUntil([&] { return !answers.empty(); });
    EXPECT_EQ(answers.size(), 1U);
    return answers.empty() ? Answer{} : answers[0];
  }
  std::string cachedFile(const std::string& serialNumber) const {
    return "/home/user/Library/Application Support/com.tarsil.Kavrel/" + sha256Hash(serialNumber) +
           "_Warranty.plist";
  }

  CoverageWorld world;
};

TEST_F(ADownload, GoesToTheEndpointOfItsDeviceAndAttestsTheLocalOneOnly) {
  struct Case {
    std::optional<std::string> serialNumber;
    const char* path;
    bool attested;
  };
  const Case cases[] = {
      {CoverageWorld::kLocal, "/api/v3/coverage/summary", true},
      {"WATCH", "/api/v2/coverage/summary", false},
      {std::nullopt, "/api/v2/coverage/summary", false},
  };
  for (const auto& test : cases) {
    world.http.clearRequests();
    EXPECT_TRUE(download(test.serialNumber).success);
    ASSERT_EQ(world.http.requests().size(), 2U) << "the version asset, then the coverage";
    const auto& request = world.http.requests()[1].request;
    EXPECT_EQ(request.url, std::string("https://coverage.example") + test.path);
    EXPECT_EQ(request.method, "POST");
    EXPECT_FALSE(request.followsRedirects);
    EXPECT_EQ(request.timeout, 30);
    EXPECT_EQ(request.sourceApplicationBundleID, "com.example.client");
    EXPECT_EQ(request.headers.value("X-Tarsil-Kest-S").has_value(), test.attested);
    EXPECT_EQ(request.headers.value("X-Tarsil-Kest").has_value(), test.attested);
  }
}

TEST_F(ADownload, LogsEachStepInItsOrder) {
  world.coverage = [](const HTTPRequest&) { return HTTPResponse{200, R"({"covered":true})", {}}; };
  EXPECT_TRUE(download("WATCH").success);
  const auto path = cachedFile("WATCH");
  std::vector<std::string> lines;
  for (const auto& line : world.log.lines()) {
    if (line.level == LogLevel::Default && !line.text.starts_with("default device"))
      lines.push_back(line.text);
  }
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
  struct Case {
    std::vector<int> statuses;
    bool success;
    std::size_t renewals;
  };
  const Case cases[] = {
      {{200}, true, 0},  {{401, 200}, true, 1},  {{401, 401, 200}, true, 2}, {{401, 401, 401}, false, 2},
      {{500}, false, 0}, {{401, 503}, false, 1}, {{302}, false, 0},          {{0}, false, 0},
      {{204}, false, 0},
  };
  for (const auto& test : cases) {
    CoverageWorld fresh;
    std::vector<int> left = test.statuses;
    fresh.coverage = [&](const HTTPRequest&) {
      HTTPResponse response{left.front(), "{}", {}};
      if (response.status == 0) response = {0, {}, Error{"http", 56, "reset"}};
      left.erase(left.begin());
      return response;
    };
    std::optional<bool> success;
    const auto downloader = std::make_shared<KVRWarrantyDownloader>(fresh.platform, "client");
    downloader->downloadWarrantyForSerialNumber(
        "WATCH",
        DownloadCompletion(fresh.log, "test", [&](bool yes, const KVRWarrantyRef&) { success = yes; }));
    fresh.queues.runUntil([&] { return success.has_value(); });
    EXPECT_EQ(success, test.success) << test.statuses.front();
    EXPECT_THAT(left, IsEmpty()) << test.statuses.front();
    EXPECT_EQ(fresh.accounts.renewals.size(), test.renewals);
    for (const auto& renewal : fresh.accounts.renewals) EXPECT_TRUE(renewal.avoidUI);
    for (std::size_t attempt = 0; attempt < test.statuses.size(); ++attempt) {
      EXPECT_EQ(fresh.log.count(format("WATCH : warranty download attempt (%d/2)", attempt)), 1U);
    }
    EXPECT_EQ(fresh.log.count("Retrying request:"), test.statuses.size());
    EXPECT_EQ(fresh.log.count("kvragent failed to load warranty"), test.success ? 0U : 1U);
    EXPECT_THAT(fresh.faults(), IsEmpty());
  }
}

TEST_F(ADownload, LeavesTheCacheAloneWhenItFails) {
  const std::pair<const char*, std::function<void(CoverageWorld&)>> failures[] = {
      {"no shared version",
       [](auto& w) {
         w.preferences.setObject(Value::Dictionary{{"LowServerVersion", 8}, {"HighServerVersion", 9}},
                                 preference::kServerVersionOverride);
       }},
      {"no account", [](auto& w) { w.accounts.primary.reset(); }},
      {"not JSON", [](auto& w) { w.coverage = [](auto&) {
                                   return HTTPResponse{200, "<html>", {}};
                                 }; }},
      {"an array", [](auto& w) { w.coverage = [](auto&) {
                                   return HTTPResponse{200, "[1]", {}};
                                 }; }},
      {"null", [](auto& w) { w.coverage = [](auto&) {
                               return HTTPResponse{200, "null", {}};
                             }; }},
      {"no body",
       [](auto& w) {
         w.coverage = [](auto&) { return HTTPResponse{200, {}, Error{"http", 0, "too large"}}; };
       }},
      {"too deep",
       [](auto& w) {
         w.coverage = [](auto&) { return HTTPResponse{200, "{\"a\":" + std::string(512, '['), {}}; };
       }},
      {"never answered", [](auto& w) { w.coverage = nullptr; }},
      {"no web address",
       [](auto& w) { w.preferences.setObject("gopher://x", preference::kWearablesWarrantyURL); }},
      {"no string", [](auto& w) { w.preferences.setObject(7, preference::kWearablesWarrantyURL); }},
      {"no file",
       [](auto& w) { w.preferences.setObject("file:///none", preference::kWearablesWarrantyURL); }},
  };
  ASSERT_TRUE(download("WATCH").success);
  const auto fileBefore = world.files.get(cachedFile("WATCH"));
  const CacheMetadata metadata("WATCH");
  const auto dateBefore = world.preferences.objectForKey(metadata.lastUpdatedDateKey);
  ASSERT_TRUE(fileBefore && dateBefore.isDate());

  for (const auto& [name, breakIt] : failures) {
    world.reset();
    world.queues.advance(10);
    breakIt(world);
    world.log.clear();
    const auto answer = download("WATCH");
    EXPECT_FALSE(answer.success) << name;
    EXPECT_EQ(answer.warranty, nullptr) << name;
    EXPECT_EQ(world.files.get(cachedFile("WATCH")), fileBefore) << name;
    EXPECT_EQ(world.preferences.objectForKey(metadata.lastUpdatedDateKey), dateBefore) << name;
    const bool gated = std::string_view(name) == "no shared version";
    EXPECT_EQ(world.log.count("Warranty download skipped server due to server version"), gated ? 1U : 0U)
        << name;
    EXPECT_EQ(world.log.count("kvragent failed to load warranty"), gated ? 0U : 1U) << name;
    EXPECT_EQ(world.log.count("Unable to load sign request, failing warranty download"),
              std::string_view(name) == "no account" ? 1U : 0U);
  }
}

TEST_F(ADownload, AnswersAtOnceWhenAnOverrideRejectsTheService) {
  world.preferences.setObject(Value::Dictionary{{"LowServerVersion", 8}, {"HighServerVersion", 9}},
                              preference::kServerVersionOverride);
  std::optional<bool> success;
  std::make_shared<KVRWarrantyDownloader>(world.platform, "client")
      ->downloadWarrantyForSerialNumber(
          "WATCH",
          DownloadCompletion(world.log, "test", [&](bool yes, const KVRWarrantyRef&) { success = yes; }));
  EXPECT_EQ(success, false);
  EXPECT_THAT(world.http.requests(), IsEmpty());
}

TEST_F(ADownload, WaitsForARenewalForAMinuteAtMost) {
  world.accounts.tokens.clear();
  world.accounts.renewal.never = true;
  const auto start = world.clock.now();
  EXPECT_FALSE(download("WATCH").success);
  EXPECT_EQ(world.clock.now() - start, 60);
  EXPECT_TRUE(world.log.contains(
      "No way to sign request with Vornic token because renewal of Vornic credential failed: -1, "));
}

TEST_F(ADownload, CachesAnyObjectWithItsMetadataAndWhatCannotBeWrittenWithoutAFile) {
  world.locale.identifier = "de_DE";
  world.coverage = [](const HTTPRequest&) { return HTTPResponse{200, "{}", {}}; };
  EXPECT_TRUE(download("EMPTY").warranty->dictionaryRepresentation().dictionary().empty());
  EXPECT_TRUE(world.files.get(cachedFile("EMPTY")).has_value());

  for (const char* body : {R"({"x":null})", R"({"x":"\u0001"})"}) {
    const auto before = world.files.get(cachedFile("EMPTY"));
    world.queues.advance(5);
    world.coverage = [body](const HTTPRequest&) { return HTTPResponse{200, body, {}}; };
    const auto answer = download("EMPTY");
    ASSERT_TRUE(answer.success);
    EXPECT_EQ(answer.warranty->dictionaryRepresentation(), *readJSON(body)) << "the client gets it whole";
    EXPECT_EQ(world.files.get(cachedFile("EMPTY")), before);
    const CacheMetadata metadata("EMPTY");
    EXPECT_EQ(world.preferences.dateForKey(metadata.lastUpdatedDateKey), world.clock.now());
    EXPECT_EQ(world.preferences.stringForKey(metadata.localeKey), "de_DE");
    EXPECT_EQ(world.preferences.stringForKey(metadata.versionKey), "2");
  }
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
  world.files.put("/secret.plist", "{ covered = YES; }");
  world.files.erase("/data/w x.plist");
  EXPECT_FALSE(download("/../../../secret").success) << "no way out of the directory";
  EXPECT_TRUE(world.log.contains("URL 'file:///data/w%20x.plist' contains no plist data"));
  for (const auto& sent : world.http.requests()) EXPECT_THAT(sent.request.url, HasSubstr("assets.example"));
}

}  // namespace
}  // namespace kvr
