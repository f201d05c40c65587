#include "unit/SimulatedTest.h"

namespace kvr {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;

class ASimulatedScheduler : public SimulatedTest {
 protected:
  ActivityBlock recorder(ActivityResult result = ActivityResult::Finished) {
    return [this, result](const ActivityHandler& handler) {
      dates.push_back(simulated.clock.now() - start);
      handler(result);
    };
  }
  void add(const std::string& identifier, const ActivityCriteria& criteria, ActivityBlock block) {
    const auto activity = simulated.activities.newActivity(identifier);
    activity->setCriteria(criteria);
    activity->schedule(std::move(block));
  }

  const Date start = simulated.clock.now();
  std::vector<double> dates;  ///< of runs, in seconds since the start
};

TEST_F(ASimulatedScheduler, RunsOnceInsideTheWindowInVirtualTime) {
  add("a", {3600, 360}, recorder());
  simulated.queues.advance(3599);
  EXPECT_THAT(dates, IsEmpty());
  simulated.queues.advance(400);
  EXPECT_THAT(dates, ElementsAre(::testing::AllOf(::testing::Ge(3600), ::testing::Lt(3961))));
  simulated.queues.advance(1e7);
  EXPECT_THAT(dates, SizeIs(1));
  EXPECT_THAT(simulated.files.getPropertyList(
                  "/home/user/Library/Activities/com.tarsil.kvragent.plist")["activities"],
              Value(Value::Dictionary{}));
}

TEST_F(ASimulatedScheduler, FollowsAClockThatIsMoved) {
  add("a", {86400, 0}, recorder());
  simulated.queues.run();
  simulated.clock.moveBy(-315'360'000);
  simulated.queues.advance(86400);
  EXPECT_THAT(dates, IsEmpty());
  simulated.clock.moveBy(2 * 315'360'000.0);
  simulated.queues.run();
  EXPECT_THAT(dates, SizeIs(1));
}

TEST_F(ASimulatedScheduler, DefersARunWhoseHandlerIsDropped) {
  add("a", {}, [this](const ActivityHandler&) { dates.push_back(simulated.clock.now() - start); });
  simulated.queues.advance(35);
  EXPECT_THAT(dates, SizeIs(3)) << "at once, after 10 s and after 20 s more";
  EXPECT_EQ(simulated.activities.runsUnderWay(), 0U);
  EXPECT_THAT(simulated.log.takeFaults(), SizeIs(3));
}

TEST_F(ASimulatedScheduler, AsksARunToDeferWhenItsNetworkIsGone) {
  bool before = true;
  bool after = false;
  add("a", {0, 0, true}, [&](const ActivityHandler& handler) {
    const auto activity = simulated.activities.newActivity("a");
    before = activity->shouldDefer().has_value();
    simulated.activities.setNetworkReachable(false);
    after = activity->shouldDefer().has_value();
    simulated.activities.setNetworkReachable(true);
    handler(ActivityResult::Finished);
  });
  simulated.queues.run();
  EXPECT_FALSE(before);
  EXPECT_TRUE(after);
}

}  // namespace
}  // namespace kvr
