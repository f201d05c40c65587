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
  world.preferences.setObject("https://assets.example/kvrV2.plist", preference::kServerVersionURL);
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

TEST_F(AStart, RunsNoActivityBeforeItIsThrough) {
  world.preferences.setObject(inDays(-1), std::string(names::kOutreach) + names::kTargetDateSuffix);
  // Simulates other threads that run while migration asks for the device.
  world.deviceProperties.whenAsked = [this] { world.queues.run(); };
  const StartUp startUp(world.platform);
  world.deviceProperties.whenAsked = nullptr;
  EXPECT_FALSE(world.log.contains("trigger activity"));
  world.queues.run();
  EXPECT_TRUE(world.log.contains("trigger activity"));
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

}  // namespace
}  // namespace kvr
