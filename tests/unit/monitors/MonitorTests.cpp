#include "core/followup/KVRFollowUp.h"
#include "core/monitors/KVRLocaleMonitor.h"
#include "core/monitors/KVRPairedDevicesMonitor.h"
#include "platform/codec/JSON.h"
#include "platform/names/Names.h"
#include "unit/OfferWorld.h"

namespace kvr {
namespace {

struct Monitors : AnOfferTest {
  Monitors() {
    world.coverage = [this](const HTTPRequest&) { return HTTPResponse{200, *writeJSON(coverage), {}}; };
  }
  ~Monitors() override { world.notifications.end(); }

  Value coverage = shownInDays(2, 20);
  const DeviceInfosQuery deviceInfos = newAgentQuery(world.platform);
};

TEST_F(Monitors, LookUpAllDevicesAndScheduleThePostWhenAWatchIsPairedOrUnpaired) {
  const auto monitor = KVRPairedDevicesMonitor::initWithAgent(world.platform, deviceInfos);
  monitor->start();
  EXPECT_NE(monitor->pairNotifyToken, monitor->unpairNotifyToken);
  world.pair("W", inDays(-30));
  world.notifications.post(names::kDeviceDidPair);
  world.queues.run();
  EXPECT_EQ(target(names::kFollowUpPost), inDays(2));
  EXPECT_EQ(world.http.requests().size(), 4U) << "a version and a warranty for each of two devices";
  EXPECT_TRUE(world.log.contains(format(
      "Watch paired after phone's refreshActivity has already finished. Schedule followUp post for: %@",
      inDays(2))));

  pend(KVRFollowUp::uniqueIdentfierForSerialNumber("GONE"), {{names::kFollowUpSerialNumber, "GONE"}});
  world.notifications.post(names::kDeviceDidUnpair);
  world.queues.run();
  EXPECT_THAT(pending(), IsEmpty()) << "of a watch that is tracked no more";
}

TEST_F(Monitors, MakeUpForNotificationsBeyondALimitWhileNobodyAnswers) {
  const auto paired = KVRPairedDevicesMonitor::initWithAgent(world.platform, deviceInfos);
  paired->start();
  const auto locale = KVRLocaleMonitor::initWithAgent(world.platform, deviceInfos);
  locale->start();
  pend("shown", {{names::kFollowUpSerialNumber, "LOCAL"}});
  world.coverage = nullptr;
  const auto lookUps = [this] { return world.log.count("getting warranty using policy LOCAL: 0"); };
  for (const auto* name : {names::kDeviceDidPair, names::kLanguageChanged}) {
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
  const auto monitor = KVRLocaleMonitor::initWithAgent(world.platform, deviceInfos);
  monitor->start();
  const auto start = world.clock.now();
  const auto change = [&] {
    world.notifications.post(names::kLanguageChanged);
    world.queues.advance(1);
  };
  change();
  change();
  world.queues.advance(10);
  EXPECT_THAT(world.cleanExit.requests, ElementsAre(start + 5, start + 6));
  EXPECT_THAT(world.http.requests(), IsEmpty());

  pend("shown", {{names::kFollowUpSerialNumber, "LOCAL"}});
  change();
  world.queues.advance(10);
  EXPECT_EQ(world.http.requests().size(), 2U);
  EXPECT_EQ(pending()[0].title, Value("Zub"));
  EXPECT_TRUE(world.log.contains("Device infos refreshed after locale change"));
  EXPECT_EQ(world.cleanExit.requests.size(), 3U);
}

}  // namespace
}  // namespace kvr
