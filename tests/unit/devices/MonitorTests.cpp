#include "agent/KVRAgent.h"
#include "devices/KVRLocaleMonitor.h"
#include "devices/KVRPairedDevicesMonitor.h"
#include "followup/KVRFollowUp.h"
#include "platform/JSON.h"
#include "unit/followup/OfferWorld.h"

namespace kvr {
namespace {

struct Monitors : AnOfferTest {
  Monitors() {
    world.coverage = [this](const HTTPRequest&) { return HTTPResponse{200, *writeJSON(coverage), {}}; };
  }
  ~Monitors() override { world.notifications.end(); }

  Value coverage = shownInDays(2, 20);
  const std::shared_ptr<KVRAgent> agent = KVRAgent::initWithCallingProcessBundleID(world.platform, "client");
};

TEST_F(Monitors, LookUpAllDevicesAndScheduleThePostWhenAWatchIsPairedOrUnpaired) {
  const auto monitor = KVRPairedDevicesMonitor::initWithAgent(world.platform, agent);
  monitor->start();
  EXPECT_NE(monitor->pairNotifyToken, monitor->unpairNotifyToken);
  world.pair("W", inDays(-30));
  world.notifications.post(PairedDeviceRegistry::kDeviceDidPair);
  world.queues.run();
  EXPECT_EQ(target(activity::kFollowUpPost), inDays(2));
  EXPECT_EQ(world.http.requests().size(), 4U) << "a version and a warranty for each of two devices";
  EXPECT_TRUE(world.log.contains(format(
      "Watch paired after phone's refreshActivity has already finished. Schedule followUp post for: %@",
      inDays(2))));

  pend(KVRFollowUp::uniqueIdentfierForSerialNumber("GONE"), {{kFollowUpSerialNumberKey, "GONE"}});
  world.notifications.post(PairedDeviceRegistry::kDeviceDidUnpair);
  world.queues.run();
  EXPECT_THAT(pending(), IsEmpty()) << "of a watch that is tracked no more";
}

TEST_F(Monitors, MakeUpForNotificationsBeyondALimitWhileNobodyAnswers) {
  const auto paired = KVRPairedDevicesMonitor::initWithAgent(world.platform, agent);
  paired->start();
  const auto locale = KVRLocaleMonitor::initWithAgent(world.platform, agent);
  locale->start();
  pend("shown", {{kFollowUpSerialNumberKey, "LOCAL"}});
  world.coverage = nullptr;
  const auto lookUps = [this] { return world.log.count("getting warranty using policy LOCAL: 0"); };
  for (const auto* name : {PairedDeviceRegistry::kDeviceDidPair, UserLocale::kLanguageChanged}) {
    for (int i = 0; i < 3 * RefreshLimit::kMost; ++i) world.notifications.post(name);
    world.log.clear();
    world.queues.advance(6);
    EXPECT_EQ(lookUps(), RefreshLimit::kMost) << name;
    EXPECT_EQ(world.log.count("16 look-ups after notifications are under way, one makes up for what follows"),
              1U);
    world.queues.advance(600);
    EXPECT_EQ(lookUps(), RefreshLimit::kMost + 1) << name;
  }
}

TEST_F(Monitors, CheckFiveSecondsAfterEveryChangeOfLanguageAndEndThen) {
  const auto monitor = KVRLocaleMonitor::initWithAgent(world.platform, agent);
  monitor->start();
  const auto start = world.clock.now();
  const auto change = [&] {
    world.notifications.post(UserLocale::kLanguageChanged);
    world.queues.advance(1);
  };
  change();
  change();
  world.queues.advance(10);
  EXPECT_THAT(world.cleanExit.requests, ElementsAre(start + 5, start + 6));
  EXPECT_THAT(world.http.requests(), IsEmpty());

  pend("shown", {{kFollowUpSerialNumberKey, "LOCAL"}});
  change();
  world.queues.advance(10);
  EXPECT_EQ(world.http.requests().size(), 2U);
  EXPECT_EQ(pending()[0].title, Value("Zub"));
  EXPECT_TRUE(world.log.contains("Device infos refreshed after locale change"));
  EXPECT_EQ(world.cleanExit.requests.size(), 3U);
}

}  // namespace
}  // namespace kvr
