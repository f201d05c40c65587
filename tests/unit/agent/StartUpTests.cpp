#include "core/agent/AgentKeys.h"
#include "core/agent/StartUp.h"
#include "platform/names/Names.h"
#include "unit/OfferWorld.h"

#include <cerrno>

namespace kvr {
namespace {

constexpr const char* kActivities = "/home/user/Library/Activities/com.tarsil.kvragent.plist";

/// Prepares a device that is already set up, with no upgrade or boot since.
void setUp(CoverageWorld& world) {
  world.preferences.setObject(true, preference::kPostUpgradeActivityCompleted);
  world.preferences.setObject("17.9", preference::kPostUpgradeOSVersion);
  world.files.putPropertyList(kActivities,
                              Dictionary{{"OSVersion", "17.9"}, {"bootIdentifier", world.activities.boot}});
}

struct AStart : AnOfferTest {
  AStart() { setUp(world); }
  ~AStart() override { world.notifications.end(); }
};

TEST_F(AStart, ServesTheBootBeforeTheUpgradeAndHasThatStoredInBetween) {
  for (std::uint64_t seed = 1; seed <= 20; ++seed) {
    CoverageWorld upgraded(seed);
    setUp(upgraded);
    upgraded.deviceProperties.answers["ProductVersion"] = "17.10";
    upgraded.activities.boot = "another";
    Value bootThen;
    upgraded.files.whenChanged([&](const std::string& path, bool) {
      const bool isScheduling = upgraded.log.contains("Forcing conversion outreach on upgrade");
      if (!isScheduling || !bootThen.isNull() || path.find("/Preferences/") == std::string::npos) return;
      bootThen = upgraded.files.getPropertyList(kActivities)["bootIdentifier"];
    });
    const StartUp startUp(upgraded.platform);
    upgraded.queues.advance(60);
    EXPECT_EQ(bootThen, Value("another"))
        << "a boot that came back would find what the upgrade has scheduled";
    EXPECT_EQ(upgraded.preferences.dateForKey(preference::kConversionOutreachScheduledDate), std::nullopt);
    EXPECT_EQ(upgraded.files.getPropertyList(kActivities)["OSVersion"], Value("17.10"));
    EXPECT_TRUE(upgraded.log.contains("for conversion outreach"));
    EXPECT_THAT(upgraded.faults(), IsEmpty());
  }
}

TEST_F(AStart, GivesAMigratedFollowUpARefreshThatDoesNotComeTooSoon) {
  const Date change = inDays(0.5);
  world.files.putPropertyList("/home/user/Library/Application Support/com.tarsil.Kavrel/Warranty.plist",
                              due(2.5));
  pend(names::kFollowUpClient);
  const StartUp startUp(world.platform);
  world.queues.advance(3600);
  EXPECT_EQ(target(names::kFollowUpRefresh), change);
  EXPECT_THAT(pending(), SizeIs(1)) << "though its warranty is not valid until it has been downloaded";
}

TEST_F(AStart, PerformsAnUpgradeWhoseRecordIsLostAndOnlyOnce) {
  for (const bool isDiskFull : {true, false}) {
    world.preferences.removeObject(preference::kPostUpgradeActivityCompleted);
    world.files.setStepFault([&](SimulatedFiles::Step, const std::string& path) -> std::optional<Error> {
      if (!isDiskFull || path.find("Preferences") == std::string::npos) return std::nullopt;
      return Error{"files", ENOSPC, "full"};
    });
    world.log.clear();
    const StartUp startUp(world.platform);
    world.queues.advance(3600);
    const auto* const line = "post upgrade activity hasn't yet been performed, perform upgrade activity";
    EXPECT_EQ(world.log.count(line), 1U);
    EXPECT_EQ(world.preferences.boolForKey(preference::kPostUpgradeActivityCompleted), !isDiskFull);
    EXPECT_EQ(world.files.getPropertyList(kActivities)["OSVersion"], Value("17.9"));
    world.notifications.end();
  }
}

TEST_F(AStart, RunsEveryOutreachThatAClientAsksForAndNoneTooSoon) {
  const StartUp startUp(world.platform);
  const auto client = world.services.connect(names::kAgent, {{{names::kEntitlement, true}}, 1234});
  const auto runs = [&] {
    return world.log.count(
        "-[KVROutreachActivity performActivityForScheduler:withCompletionHandler:]: for "
        "general outreach");
  };
  for (std::size_t run = 0; run < 12; ++run) {
    const bool isDelayed = run % 2 == 1;
    isDelayed ? client->invoke("ScheduleOutreachAfter", {0.7}) : client->invoke("ScheduleOutreach");
    world.queues.advance(0.69);
    EXPECT_EQ(runs(), isDelayed ? run : run + 1);
    world.queues.advance(10);
    EXPECT_EQ(runs(), run + 1);
  }
}

TEST_F(AStart, WorksByTheDefaultsWhereNothingIsStored) {
  const StartUp startUp(world.platform);
  const auto client = world.services.connect(names::kAgent, {{{names::kEntitlement, true}}, 1234});
  const auto urlsOfALookUp = [&](const char* member, const Array& arguments) {
    world.http.clearRequests();
    client->invoke(member, arguments);
    world.queues.run();
    std::vector<std::string> urls;
    for (const auto& sent : world.http.requests()) urls.push_back(sent.request.url);
    return urls;
  };
  const std::string assets = "https://assets.tarsil.example/library/TARSIL/asset/kvrV2.plist";
  const std::string coverage = "https://coverage.tarsil.example/api/v";
  const auto all =
      UnorderedElementsAre(assets, assets, coverage + "3/coverage/summary", coverage + "2/coverage/summary");
  world.pair("W");
  EXPECT_THAT(urlsOfALookUp("GetAllDeviceInfosUsingPolicy", {0, false}), all);
  world.queues.advance(86399);
  EXPECT_THAT(urlsOfALookUp("GetAllDeviceInfosUsingPolicy", {0, false}), IsEmpty()) << "valid for a day";
  world.queues.advance(1);
  EXPECT_THAT(urlsOfALookUp("GetAllDeviceInfosUsingPolicy", {0, false}), all);

  const std::tuple<int, int, bool> versions[] = {{1, 2, true}, {3, 4, true}, {1, 4, false}};
  for (const auto& [low, high, isShared] : versions) {
    world.asset = format("{ LowServerVersion = %d; HighServerVersion = %d; }", low, high);
    EXPECT_THAT(urlsOfALookUp("GetDeviceInfoForSerialNumber", {"LOCAL", 2}), SizeIs(isShared ? 2 : 1));
  }
  client->invoke("TarsilAccountAdded");
  world.queues.run();
  EXPECT_EQ(target(names::kOutreach), world.clock.now() + 3600);
}

TEST_F(AStart, MonitorsFiveActivitiesInTheirOrder) {
  const StartUp startUp(world.platform);
  std::vector<std::string> monitored, expected;
  for (const auto& line : world.log.texts()) {
    if (line.starts_with("monitorForScheduledActivity")) monitored.push_back(line);
  }
  // The post activity exists only while it is scheduled.
  for (const auto* identifier : {names::kPostUpgrade, names::kPostBoot, names::kOutreach,
                                 names::kConversionOutreach, names::kFollowUpRefresh}) {
    expected.push_back(format("monitorForScheduledActivity for '%@'", identifier));
  }
  EXPECT_EQ(monitored, expected);
}

TEST_F(AStart, RunsEachActivityOnceByItsCriteria) {
  const std::pair<const char*, bool> activities[] = {
      {names::kPostUpgrade, false},       {names::kPostBoot, false},        {names::kOutreach, true},
      {names::kConversionOutreach, true}, {names::kFollowUpRefresh, false}, {names::kFollowUpPost, true}};
  for (const auto& [identifier, needsNetwork] : activities) {
    SCOPED_TRACE(identifier);
    CoverageWorld device;
    setUp(device);
    const StartUp startUp(device.platform);
    const Date now = device.clock.now();
    KVRScheduler::newSchedulerForActivity(device.platform, identifier)->scheduleActivityWithDelay(3600);
    auto registration = device.files.getPropertyList(kActivities)["activities"][identifier].dictionary();
    const Date due = registration["dueDate"].date();
    EXPECT_TRUE(now + 3600 <= due && due <= now + 3960) << describe(due);
    registration.erase("dueDate");
    EXPECT_EQ(registration, (Dictionary{{"delay", 3600},
                                        {"gracePeriod", 360},
                                        {"priority", "utility"},
                                        {"registeredDate", now},
                                        {"requiresNetwork", needsNetwork}}));
    for (const bool isReachable : {false, true}) {
      device.activities.setNetworkReachable(isReachable);
      device.queues.advance(kDay);
      const auto line = format("target reached for '%@', trigger activity", identifier);
      EXPECT_EQ(device.log.count(line), needsNetwork && !isReachable ? 0U : 1U);
    }
  }
}

}  // namespace
}  // namespace kvr
