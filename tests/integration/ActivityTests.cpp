#include "integration/support/AgentWorld.h"
#include "platform/codec/JSON.h"

#include <ctime>

namespace kvr::testing {
namespace {

/// A device on which the agent has never run; all its warranties have an offer that is due.
struct ANewDevice : ::testing::Test {
  ANewDevice() {
    const auto now = static_cast<double>(std::time(nullptr));
    const Value offer = Dictionary{{"zubOfferEligibleUntil", now + 10 * kDay},
                                   {"zubOfferFollowupDisplayDate", now - kDay},
                                   {"zubLocalizedOfferLabel", "Zub"},
                                   {"zubLocalizedOfferDesc", "Add it"},
                                   {"zubLocalizedOfferSingularDesc", "One day left"},
                                   {"zubLocalizedOfferPluralDescFormat", "%@ days left"},
                                   {"zubLocalizedOfferCTA", "Add"},
                                   {"featureToggleParameters", Dictionary{{"zubOfferDisplay", true}}}};
    world.setCoverage("default", *writeJSON(offer));
    world.becomeNewDevice();
  }
  std::vector<std::string> pendingSerials() const {
    std::vector<std::string> serials;
    const auto tree = world.file("Library/FollowUps/com.tarsil.Kavrel.plist");
    for (const auto& item : tree["items"].array()) {
      serials.push_back(item["userInfo"]["FollowupSerialNumber"].string());
    }
    return serials;
  }

  AgentWorld world;
};

TEST_F(ANewDevice, GetsItsFollowUpsWhereverTheAgentIsKilledOnTheWay) {
  for (const auto* line :
       {"launched", "launched", "monitorForScheduledActivity for 'com.tarsil.kvragent.followuprefresh'"}) {
    world.startAgent();
    world.agent().waitForErrorOutput(line);
    world.agent().kill();
  }
  world.startAgent();
  // The agent may have finished its work before it was killed the last time.
  world.newClient().call("ScheduleOutreach");
  world.agent().waitForErrorOutput("Schedule refresh for: ");
  EXPECT_THAT(pendingSerials(), UnorderedElementsAre(World::kPhone, World::kFirstWatch, World::kSecondWatch));
  EXPECT_THAT(world.preferences()["FollowupPostedSerialNumberHashes"].array(), SizeIs(3));

  world.newClient().call("DismissFollowUpForSerialNumber", "s", {World::kPhone});
  EXPECT_THAT(pendingSerials(), UnorderedElementsAre(World::kFirstWatch, World::kSecondWatch));
  EXPECT_EQ(world.agent().terminate(), 0);
}

}  // namespace
}  // namespace kvr::testing
