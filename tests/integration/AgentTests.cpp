#include "integration/support/AgentWorld.h"
#include "platform/JSON.h"
#include "platform/PropertyList.h"
#include "signing/SHA256Hash.h"

#include <signal.h>

#include <algorithm>
#include <fstream>
#include <iterator>
#include <map>
#include <set>
#include <thread>

namespace kvr::testing {
namespace {

using World = AgentWorld;

class TheAgent : public ::testing::Test {
 protected:
  /// Every step that the line of a log must show, in this order.
  static void expectInOrder(const std::string& log, const std::vector<std::string>& texts) {
    std::size_t at = 0;
    for (const auto& text : texts) {
      const auto found = log.find(text, at);
      ASSERT_NE(found, std::string::npos) << "missing, or too early: " << text << "\n" << log;
      at = found + text.size();
    }
  }
  Value label(const Value& info) const { return World::warrantyIn(info)["coverageLocalizedLabel"]; }

  AgentWorld world;
};

TEST_F(TheAgent, DownloadsOnceAndThenAnswersFromTheCacheUntilTheLanguageChanges) {
  world.startAgent();
  const auto client = world.newClient();
  EXPECT_THAT(World::allInfos(client, World::Default), SizeIs(3));
  ASSERT_THAT(world.coverageRequests(), SizeIs(3));
  for (const auto& request : world.requests()) EXPECT_EQ(request["status"], Value(200)) << describe(request);
  for (const auto& request : world.coverageRequests()) {
    const bool phone = request["path"] == Value("/api/v3/coverage/summary");
    EXPECT_EQ(request["body"].string().find(World::kPhone) != std::string::npos, phone);
    EXPECT_EQ(describe(request["headers"]).find("X-Tarsil-Kest") != std::string::npos, phone);
  }

  const auto before = world.requests().size();
  for (const auto& info : World::allInfos(client, World::Default)) EXPECT_EQ(label(info), Value("Warranty"));
  EXPECT_EQ(world.requests().size(), before);

  world.setLocale("fr_FR");
  for (const auto& info : World::allInfos(client, World::Default)) EXPECT_EQ(label(info), Value("Garantie"));
  EXPECT_THAT(world.coverageRequests(), SizeIs(6));

  EXPECT_EQ(world.agent().terminate(), 0);
  const auto cacheFile = world.cacheFileOf(World::kFirstWatch);
  const std::string lookup =
      "-[KVRAgent getWarrantyUsingPolicy:serialNumber:withReply:]: shouldDownloadWarranty: ";
  const std::string watch = World::kFirstWatch;
  expectInOrder(
      world.agent().errorOutput(),
      {"default com.tarsil.Kavrel:core launched\n",
       "connection added from ",
       "default device SerialNumber: '",
       "-[KVRDevicesManager pairedDevices] - {",
       "getting warranty using policy " + watch + ": 0\n",
       "+[KVRWarranty cachedWarrantyForSerialNumber:] : warrantyPath : " + cacheFile + "\n",
       "no cached warranty : " + watch + "\n",
       "Default policy query: cached warranty is invalid, refresh it\n",
       lookup + "1\n",
       "-[KVRWarrantyDownloader downloadWarrantyForSerialNumber:completionHandler:]: " + watch + "\n",
       watch + " : warranty download attempt (0/2)\n",
       "caching warranty for locale: 'en_US', version: 2\n",
       "getAllDeviceInfosUsingPolicy: '(",
       "getting warranty using policy " + watch + ": 0\n",
       "Has cached warranty : " + watch + "\n",
       "cached warranty is for locale ('en_US') and version ('2') match system, consider it valid\n",
       "Default policy query: cached warranty is valid, examine expiration date\n",
       "warranty valid for 86",
       lookup + "0\n",
       "getWarrantyUsingPolicy completionBlock " + watch + " : 0\n",
       "cached warranty is for locale 'en_US', system is now in 'fr_FR', consider it invalid\n"});

  for (const auto& entry : std::filesystem::recursive_directory_iterator(world.home() / "Library")) {
    const auto mode = std::filesystem::status(entry).permissions() & std::filesystem::perms::mask;
    EXPECT_EQ(static_cast<unsigned>(mode), entry.is_directory() ? 0700U : 0600U) << entry.path();
    EXPECT_THAT(entry.path().string(), Not(HasSubstr("SNPHONE")));
    EXPECT_THAT(entry.path().string(), Not(HasSubstr("SNWATCH")));
  }
  const Value preferences = world.preferences();
  for (const auto& [key, value] : preferences.dictionary()) EXPECT_THAT(key, Not(HasSubstr("SN")));
}

TEST_F(TheAgent, RenewsTheTokenAfterA401) {
  world.setAccount(Dictionary{
      {"resultCode", 0}, {"tokens", Dictionary{{"com.tarsil.vornic.supportapp.auth", "renewed-token"}}}});
  world.misbehave(R"([{"status":401,"times":2}])");
  world.startAgent();
  const auto client = world.newClient();
  EXPECT_EQ(label(World::info(client, World::kFirstWatch, World::Refresh)), Value("Warranty"));
  const auto attempts = world.coverageRequests();
  ASSERT_THAT(attempts, SizeIs(3));
  for (std::size_t i = 0; i < attempts.size(); ++i) {
    EXPECT_EQ(attempts[i]["status"], Value(i < 2 ? 401 : 200));
    EXPECT_THAT(describe(attempts[i]["headers"]), HasSubstr(i == 0 ? "first-token" : "renewed-token"));
  }
}

TEST_F(TheAgent, ServesOthersWhileSomeWaitForRenewalsAndAttestations) {
  world.startAgent();
  const auto polite = world.newClient();
  ASSERT_EQ(label(World::info(polite, World::kFirstWatch, World::Default)), Value("Warranty"));

  // Both answers take an hour: whoever waits for them waits out its limit, or the end of the agent.
  world.setAccount(Dictionary{{"resultCode", 0}, {"delay", 3600}});
  world.writeDeviceFile("Attestation.plist", Dictionary{{"Delay", 3600}});
  world.misbehave(R"([{"status":401,"serialNumber":"SNWATCH00002"}])");
  std::vector<RawBusClient> waiting;
  for (int i = 0; i < 64; ++i) {
    waiting.push_back(world.newClient());
    const auto* serialNumber = i % 2 == 0 ? World::kPhone : World::kSecondWatch;
    const auto call =
        waiting.back().newCall("GetDeviceInfoForSerialNumber", "st", {serialNumber, World::Refresh});
    ASSERT_GE(sd_bus_send(waiting.back().bus(), call.get(), nullptr), 0);
    ASSERT_GE(sd_bus_flush(waiting.back().bus()), 0);
  }
  world.agent().waitForErrorOutput("Initiating device authentication");
  world.agent().waitForErrorOutput("Reprovision Vornic tokens");
  for (int i = 0; i < 20; ++i) {
    EXPECT_EQ(label(World::info(polite, World::kFirstWatch, World::CacheOnly)), Value("Warranty"));
  }
  EXPECT_EQ(world.agent().terminate(), 0) << "the end does not wait for remote answers\n"
                                          << world.agent().errorOutput();
}

TEST_F(TheAgent, SendsTheRequestWithWhateverAttestationHeadersCouldBeMade) {
  struct Case {
    Dictionary behaviour;
    bool attested;
    const char* line;
  };
  const Case cases[] = {
      {{{"Supported", false}}, false, "Kest certificate generation success: 0"},
      {{{"PreferredError", -11}}, true, "falling back to Kest (HASP)"},
      {{{"PreferredError", -4}, {"FallbackError", 9}},
       false,
       "Device authentication failed while generating certificate with error: Error Domain="},
      {{{"PreferredError", 3}},
       false,
       "Device authentication failed while generating certificate with error: Error Domain="},
      {{{"OmitChain", true}}, false, "Failed to get reference key or cert!"},
      {{}, true, "Device authentication successful"},
  };
  AgentWorld lenient(World::Attestation::Optional);
  lenient.startAgent();
  const auto client = lenient.newClient();
  for (const auto& test : cases) {
    lenient.writeDeviceFile("Attestation.plist", test.behaviour);
    const auto from = lenient.agent().errorOutput().size();
    EXPECT_EQ(label(World::info(client, World::kPhone, World::Refresh)), Value("Warranty")) << test.line;
    lenient.agent().waitForErrorOutput(test.line, from);
    const auto headers = describe(lenient.coverageRequests().back()["headers"]);
    EXPECT_EQ(headers.find("X-Tarsil-Kest-S") != std::string::npos, test.attested) << test.line;
  }
}

TEST_F(TheAgent, AnswersOneRecordADeviceForFiftyWatchesWhenEverySecondDownloadFails) {
  std::vector<std::string> watches;
  for (int i = 0; i < 50; ++i) watches.push_back("SNMANY" + std::to_string(1000 + i));
  world.pair(watches);
  world.misbehave(R"([{"status":500,"every":2}])");
  world.startAgent();
  const auto client = world.newClient();
  std::set<std::string> serialNumbers;
  std::size_t withWarranty = 0;
  const auto infos = World::allInfos(client, World::Refresh);
  for (const auto& info : infos) {
    serialNumbers.insert(info["device"]["serialNumber"].string());
    if (!World::warrantyIn(info).isNull()) ++withWarranty;
  }
  EXPECT_THAT(infos, SizeIs(51));
  EXPECT_THAT(serialNumbers, SizeIs(51));
  EXPECT_THAT(world.coverageRequests(), SizeIs(51));
  EXPECT_THAT(withWarranty, ::testing::AnyOf(25, 26));
}

TEST_F(TheAgent, CarriesEveryValueFromTheServiceToTheClientAndThroughTheCache) {
  const std::string hard =
      R"({"big":9223372036854775807,"bigger":18446744073709551615,"low":-9223372036854775808,"date":10000000000,)"
      R"("real":0.1,"huge":1e300,"empty":"","planes":"aé漢😀𠀀\udb40\udc01\udbc0\udc00","breaks":"\n\r\r\n\u0085\u2028",)"
      R"("list":[[],{},true,false],"nested":{"":"key"}})";
  world.setCoverage("default", hard);
  world.startAgent();
  const auto client = world.newClient();
  const Value expected = *readJSON(hard);
  EXPECT_EQ(World::warrantyIn(World::info(client, World::kFirstWatch, World::Refresh)), expected);
  const auto cached = World::warrantyIn(World::info(client, World::kFirstWatch, World::CacheOnly));
  EXPECT_EQ(cached, expected);
  EXPECT_EQ(*readJSON(*writeJSON(cached)), expected);

  const auto read = [&] {
    std::ifstream file(world.cacheFileOf(World::kFirstWatch));
    return std::string(std::istreambuf_iterator<char>(file), {});
  };
  const auto fileBefore = read();
  for (const char* unwritable : {R"({"x":null})", R"({"x":"\u0000"})", R"({"x":"\uffff"})"}) {
    const auto metadataBefore = world.preferences();
    world.setCoverage("default", unwritable);
    EXPECT_EQ(World::warrantyIn(World::info(client, World::kFirstWatch, World::Refresh)),
              *readJSON(unwritable));
    EXPECT_EQ(read(), fileBefore);
    EXPECT_NE(world.preferences(), metadataBefore) << "the date moves on";
  }
}

TEST_F(TheAgent, ReportsBadInputAndGoesOn) {
  world.startAgent();
  const auto client = world.newClient();
  // Does something and waits until the agent has complained of it.
  const auto expectComplaint = [&](const char* complaint, const std::function<void()>& action) {
    const auto from = world.agent().errorOutput().size();
    action();
    EXPECT_THAT(world.agent().waitForErrorOutput(complaint, from),
                HasSubstr(" error com.tarsil.Kavrel:core "));
  };
  ASSERT_EQ(label(World::info(client, World::kFirstWatch, World::Refresh)), Value("Warranty"));

  const std::pair<std::string, const char*> absurd[] = {
      {"", "it is empty"}, {std::string(100'000, 'x'), "it is too long"}, {"../../x", "it holds a slash"}};
  for (const auto& [serialNumber, complaint] : absurd) {
    expectComplaint(complaint, [&, &absurdOne = serialNumber] {
      const auto info = World::info(client, absurdOne, World::Refresh);
      EXPECT_EQ(info["device"]["name"], Value("<unknown>"));
      EXPECT_EQ(World::warrantyIn(info), Value());
    });
  }
  const std::filesystem::path file = world.cacheFileOf(World::kFirstWatch);
  std::ofstream(file, std::ios::trunc) << "<plist><dict><key>half";
  expectComplaint("set aside as", [&] {
    EXPECT_EQ(World::warrantyIn(World::info(client, World::kFirstWatch, World::CacheOnly)), Value());
  });
  EXPECT_FALSE(std::filesystem::exists(file));
  EXPECT_EQ(label(World::info(client, World::kFirstWatch, World::Default)), Value("Warranty"));
  expectComplaint("Locale.plist is damaged and counts as missing", [&] {
    world.directory.write("device/Locale.plist", "garbage {");
    EXPECT_EQ(label(World::info(client, World::kFirstWatch, World::Default)), Value("Warranty"));
  });
}

TEST_F(TheAgent, EndsWithAnErrorWhenItLosesTheBusAndCleanlyWhenAsked) {
  world.startAgent();
  world.bus.kill();
  EXPECT_GT(world.agent().wait(), 0) << "a status, not a signal";
  EXPECT_THAT(world.agent().errorOutput(), HasSubstr("error com.tarsil.Kavrel:core "));
}

TEST_F(TheAgent, LeavesCleanlyAfterAChangeOfLanguageAndComesBackWhenItIsCalled) {
  world.letTheBusStartIt();
  const auto client = world.newClient();
  client.call("DefaultDevice");
  world.setLocale("fr_FR");
  world.waitForName(false);
  world.bus.daemon().waitForErrorOutput("agent: status 0");
  const auto before = world.bus.daemon().errorOutput().size();
  EXPECT_EQ(label(World::info(client, World::kPhone, World::Default)), Value("Garantie"));
  world.setLocale("en_US");
  world.waitForName(false);
  world.pair({World::kFirstWatch});  // which brings it back without a call
  world.bus.daemon().waitForErrorOutput("Devices followups to be posted, if required", before);
}

TEST_F(TheAgent, FollowsTheFileOfPairedWatches) {
  world.pair({});
  world.startAgent();
  world.pair({World::kFirstWatch});
  world.agent().waitForErrorOutput("Devices followups to be posted, if required, after paired device change");
  EXPECT_THAT(world.coverageRequests(), SizeIs(2));
}

TEST_F(TheAgent, KnowsTheSupportApplicationInTheUsersLanguage) {
  world.writeDeviceFile("Applications.plist",
                        Dictionary{{"com.tarsil.support", Dictionary{{"localizedName", "Support"}}}});
  world.writeDeviceFile("Store.plist", Dictionary{{"purchaseDelay", 3600}});
  world.writeDeviceFile("Resources/KavrelUI/nl/Localizable.plist", Dictionary{{"INSTALLED", "Aanwezig"}});
  world.startAgent();
  const auto waiting = world.newClient();
  // For the store, which holds up nobody else.
  std::uint64_t cookie = 0;
  sd_bus_send(waiting.bus(), waiting.newCall("AppSupportAvailability", "s", {"not there"}).get(), &cookie);
  sd_bus_flush(waiting.bus());
  const auto client = world.newClient();
  for (const auto& [locale, text] : std::map<std::string, std::string>{{"en_GB", "Installed"},
                                                                       {"de_AT", "Installiert"},
                                                                       {"fr", "Installée"},
                                                                       {"ja_JP", "インストール済み"},
                                                                       {"nl_NL", "Aanwezig"},
                                                                       {"pt_BR", "Installed"}}) {
    world.setLocale(locale);
    const auto answer =
        client.value("a{sv}", client.call("AppSupportAvailability", "s", {"com.tarsil.support"}));
    EXPECT_EQ(answer["AppAvailablityText"], Value(text)) << locale;
    EXPECT_EQ(answer["AppVendorName"], Value(""));
  }
}

TEST_F(TheAgent, MigratesWhatAnEarlierVersionLeft) {
  const std::string caches = "home/Library/Application Support/com.tarsil.Kavrel/";
  world.directory.write(caches + "Warranty.plist",
                        *writePropertyList(*readJSON(R"({"covered":true,"coverageLocalizedLabel":"Old"})"),
                                           PropertyListEncoding::XML));
  world.directory.write("home/Library/FollowUps/com.tarsil.Kavrel.plist",
                        "{ items = ( { uniqueIdentifier = \"com.tarsil.Kavrel\"; displayStyle = 2; } ); }");
  world.startAgent();
  EXPECT_TRUE(std::filesystem::exists(world.cacheFileOf(World::kPhone)));
  EXPECT_FALSE(std::filesystem::exists(world.directory / (caches + "Warranty.plist")));
  EXPECT_EQ(world.file("Library/FollowUps/com.tarsil.Kavrel.plist")["items"].array()[0]["uniqueIdentifier"],
            Value("com.tarsil.Kavrel." + sha256Hash(World::kPhone)));
  EXPECT_EQ(world.preferences()["KVRMigrationVersion"], Value(2));
}

}  // namespace
}  // namespace kvr::testing
