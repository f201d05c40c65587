#include "integration/support/AgentWorld.h"

namespace kvr::testing {
namespace {

struct TheAgent : ::testing::Test {
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
  for (const auto& entry : std::filesystem::recursive_directory_iterator(world.home() / "Library")) {
    const auto mode = std::filesystem::status(entry).permissions() & std::filesystem::perms::mask;
    EXPECT_EQ(static_cast<unsigned>(mode), entry.is_directory() ? 0700U : 0600U) << entry.path();
    EXPECT_THAT(entry.path().string(), Not(HasSubstr("SNPHONE")));
    EXPECT_THAT(entry.path().string(), Not(HasSubstr("SNWATCH")));
  }
  const Value preferences = world.preferences();
  for (const auto& [key, value] : preferences.dictionary()) EXPECT_THAT(key, Not(HasSubstr("SN")));
}

TEST_F(TheAgent, ServesOthersWhileSomeWaitForRenewalsAndAttestations) {
  world.startAgent();
  const auto polite = world.newClient();
  ASSERT_EQ(label(World::info(polite, World::kFirstWatch, World::Default)), Value("Warranty"));

  // Both answers take an hour, so a caller waits until its own limit or until the agent ends.
  world.setAccount(Dictionary{{"resultCode", 0}, {"delay", 3600}});
  world.writeDeviceFile("Attestation.plist", Dictionary{{"Delay", 3600}});
  world.misbehave(R"([{"status":401,"serialNumber":"SNWATCH00002"}])");
  std::vector<RawBusClient> waiting;
  for (int i = 0; i < 64; ++i) {
    waiting.push_back(world.newClient());
    const auto* serialNumber = i % 2 == 0 ? World::kPhone : World::kSecondWatch;
    waiting.back().send("GetDeviceInfoForSerialNumber", "st", {serialNumber, World::Refresh});
  }
  world.agent().waitForErrorOutput("Initiating device authentication");
  world.agent().waitForErrorOutput("Reprovision Vornic tokens");
  for (int i = 0; i < 20; ++i) {
    EXPECT_EQ(label(World::info(polite, World::kFirstWatch, World::CacheOnly)), Value("Warranty"));
  }
  EXPECT_EQ(world.agent().terminate(), 0) << "it waits for remote answers: " << world.agent().errorOutput();
}

TEST_F(TheAgent, EndsWithAnErrorWhenItLosesTheBus) {
  world.setPreferences(
      Dictionary{{"PostUpgradeActivityCompleted", true}, {"InitialOutreachActivityScheduled", true}});
  world.startAgent();
  const auto client = world.newClient();
  client.send("TarsilAccountAdded");
  world.agent().waitForErrorOutput("New warranty to be downloaded after: 3600");
  world.bus.kill();
  EXPECT_GT(world.agent().wait(), 0) << "a status, not a signal";
  EXPECT_THAT(world.agent().errorOutput(), HasSubstr("error com.tarsil.Kavrel:core "));
  EXPECT_THAT(world.agent().errorOutput(), Not(HasSubstr("went without an answer")));
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
  world.pair({World::kFirstWatch});  // it starts the agent again without a call
  world.bus.daemon().waitForErrorOutput("Devices followups to be posted, if required", before);
}

TEST_F(TheAgent, ServesOnWhenNobodyReadsItsLogAnyMore) {
  world.prologue = "mkfifo \"$HOME/log\"\nexec 3<>\"$HOME/log\" 2>\"$HOME/log\" 3<&-";
  world.startAgent();
  EXPECT_THAT(World::allInfos(world.newClient(), World::CacheOnly), SizeIs(3));
  EXPECT_EQ(world.agent().terminate(), 0);
}

TEST_F(TheAgent, SaysFirstThatItWasLaunched) {
  for (const auto* file : {"Network.plist", "Locale.plist", "PairedDevices.plist"}) {
    world.directory.write(std::string("device/") + file, "damaged");
  }
  world.moreEnvironment = {{"KVR_LOG_LEVEL", "debug"}};
  world.startAgent();
  world.agent().waitForErrorOutput("Network.plist is damaged");
  const auto output = world.agent().errorOutput();
  EXPECT_THAT(output.substr(0, output.find('\n')), HasSubstr(" default com.tarsil.Kavrel:core launched"));
}

TEST_F(TheAgent, HandlesSixteenNotificationsInARowAndAsManyEditsEachOnItsOwn) {
  for (const bool areEdits : {false, true}) {
    world.writeDeviceFile("FeatureFlags.plist", Dictionary{});  // only the phone is looked up
    world.pair({});
    world.startAgent();
    const auto client = world.newClient();
    World::info(client, World::kPhone, World::Default);
    for (int i = 0; i < 16; ++i) {
      if (areEdits) {
        i % 2 == 0 ? world.pair({World::kFirstWatch}) : world.pair({});
      } else {
        sd_bus_emit_signal(client.bus(), "/com/tarsil/NotificationCenter", "com.tarsil.NotificationCenter",
                           "Posted", "s", "com.tarsil.pairedregistry.device-did-unpair");
      }
    }
    ASSERT_GE(sd_bus_flush(client.bus()), 0);
    const std::string line = "Devices followups to be posted, if required, after paired device change";
    std::size_t from = 0;
    for (int i = 0; i < 16; ++i) {
      world.agent().waitForErrorOutput(line, from);
      from = world.agent().errorOutput().find(line, from) + line.size();
    }
    EXPECT_EQ(world.agent().terminate(), 0);
    world.waitForName(false);
  }
}

TEST_F(TheAgent, KnowsTheSupportApplicationInTheUsersLanguage) {
  world.writeDeviceFile("Applications.plist",
                        Dictionary{{"com.tarsil.support", Dictionary{{"localizedName", "Support"}}}});
  world.writeDeviceFile("Store.plist", Dictionary{{"purchaseDelay", 3600}});
  world.writeDeviceFile("Resources/KavrelUI/nl/Localizable.plist", Dictionary{{"INSTALLED", "Aanwezig"}});
  world.startAgent();
  const auto waiting = world.newClient();
  // This call waits for the store and must not delay other clients.
  waiting.send("AppSupportAvailability", "s", {"not there"});
  const auto client = world.newClient();
  const std::pair<const char*, const char*> texts[] = {{"en_GB", "Installed"}, {"de_AT", "Installiert"},
                                                       {"fr", "Installée"},    {"ja_JP", "インストール済み"},
                                                       {"nl_NL", "Aanwezig"},  {"pt_BR", "Installed"}};
  for (const auto& [locale, text] : texts) {
    world.setLocale(locale);
    const auto reply = client.call("AppSupportAvailability", "s", {"com.tarsil.support"});
    const auto answer = client.value("a{sv}", reply);
    EXPECT_EQ(answer["AppAvailablityText"], Value(text)) << locale;
    EXPECT_EQ(answer["AppVendorName"], Value(""));
  }
  EXPECT_EQ(world.agent().terminate(), 0);
  const auto atTheEnd = waiting.next();
  ASSERT_TRUE(atTheEnd);
  EXPECT_EQ(atTheEnd->error, "");
}

}  // namespace
}  // namespace kvr::testing
