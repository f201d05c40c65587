#include "core/scheduling/KVRScheduler.h"
#include "unit/SimulatedTest.h"

namespace kvr {
namespace {

constexpr const char* kKey = "test.TargetDate";

/// An activity whose work the test sets.
struct FakeActivity : KVRSchedulerActivityDelegate {
  bool network = false;
  std::function<void(ActivityHandler)> work = [](const ActivityHandler& handler) {
    handler(ActivityResult::Finished);
  };
  std::string identifier() const override { return "test"; }
  bool requiresNetwork() const override { return network; }
  void performActivityForScheduler(const std::shared_ptr<KVRScheduler>&, ActivityHandler handler) override {
    work(std::move(handler));
  }
};

struct AScheduler : SimulatedTest {
  const std::shared_ptr<FakeActivity> activity = std::make_shared<FakeActivity>();
  const std::shared_ptr<KVRScheduler> scheduler =
      KVRScheduler::newSchedulerWithActivityDelegate(world.platform, activity);
  const Date start = world.clock.now();

  std::optional<Date> target() { return world.preferences.dateForKey(kKey); }
  std::vector<std::string> newLines() {
    auto lines = world.log.texts();
    world.log.clear();
    return lines;
  }
};

TEST_F(AScheduler, RegistersDelaysInWholeSecondsAndKeepsTheDateAsItIs) {
  const std::tuple<double, int, int> cases[] = {{3600, 3600, 360}, {86400, 86400, 8640}, {15, 15, 1},
                                                {9.9, 9, 0},       {-300, 0, 0},         {0, 0, 0}};
  for (const auto& [delay, criterion, grace] : cases) {
    for (const bool byDate : {true, false}) {
      activity->network = byDate;
      newLines();
      byDate ? scheduler->scheduleActivityForDate(start + delay)
             : scheduler->scheduleActivityWithDelay(delay);
      EXPECT_EQ(target(), start + delay);
      const auto registration = world.files.getPropertyList(
          "/home/user/Library/Activities/com.tarsil.kvragent.plist")["activities"]["test"];
      EXPECT_EQ(registration["delay"], Value(criterion));
      EXPECT_EQ(registration["gracePeriod"], Value(grace));
      EXPECT_EQ(registration["requiresNetwork"], Value(byDate));
      EXPECT_THAT(newLines(), ElementsAre(format("scheduled 'test' with delay: %.02f (%@)",
                                                 (start + delay) - start, start + delay)));
    }
  }
  scheduler->scheduleActivityForDate(std::nullopt);
  EXPECT_EQ(target(), std::nullopt);
  EXPECT_THAT(newLines(), ElementsAre("scheduled 'test' with delay: 0.00 ((null))"));
}

TEST_F(AScheduler, LetsTheDelegateRunFromTheTargetDateOn) {
  const std::pair<std::optional<double>, bool> cases[] = {
      {std::nullopt, true}, {-1, true}, {0, true}, {90, false}};
  for (const auto& [delay, runs] : cases) {
    world.preferences.setObject(delay ? Value(world.clock.now() + *delay) : Value(), kKey);
    const auto before = target();
    const auto asked = world.clock.now();
    newLines();
    std::optional<Date> answered;
    std::optional<ActivityResult> result;
    scheduler->performScheduledOutreachWithBlock(ActivityHandler(world.log, "test", [&](ActivityResult it) {
      result = it;
      answered = world.clock.now();
    }));
    EXPECT_EQ(target(), runs ? std::nullopt : before) << "at once";
    EXPECT_THAT(newLines(), ElementsAre(format("activity for 'test' should occur on: %@", before),
                                        runs ? "target reached for 'test', trigger activity"
                                             : "target not past for 'test', defer for: 90.00"));
    world.queues.advance(5);
    EXPECT_EQ(result, runs ? ActivityResult::Finished : ActivityResult::Deferred);
    EXPECT_EQ(answered, asked + 1);
  }
}

TEST_F(AScheduler, ClearsEveryTargetDateAndNothingElse) {
  for (const char* key : {"a.TargetDate", "b.TargetDate", "c.TargetDate.x", ".TargetDatex"}) {
    world.preferences.setObject(start, key);
  }
  KVRScheduler::clearScheduledActivities(world.platform);
  EXPECT_THAT(world.preferences.allKeys(), ElementsAre(".TargetDatex", "c.TargetDate.x"));
  EXPECT_THAT(newLines(), ElementsAre("Clearing a.TargetDate", "Clearing b.TargetDate"));
}

TEST_F(AScheduler, SaysOnceThatReactionsAreHeldBackAndRunsADemandAllTheSame) {
  int runs = 0;
  activity->work = [&runs](const ActivityHandler& handler) {
    ++runs;
    handler(ActivityResult::Finished);
  };
  for (int i = 0; i < 12; ++i) {
    scheduler->scheduleActivityForDate(start);
    world.queues.advance(5);
  }
  EXPECT_EQ(runs, 6);
  EXPECT_EQ(world.log.count("'test' was started 6 times within 600 seconds, and is held back until " +
                            describe(start + 600)),
            1U);
  scheduler->scheduleActivityWithDelay(0, RegistrationCause::Demand);
  world.queues.advance(5);
  EXPECT_EQ(runs, 7);
}

TEST_F(AScheduler, ComesBackToARunWhoseWorkFailsOrDropsItsAnswer) {
  int runs = 0;
  activity->work = [&](const ActivityHandler&) {
    if (++runs == 2) throw std::runtime_error("no answer");
  };
  scheduler->scheduleActivityForDate(start);
  world.queues.advance(35);
  EXPECT_EQ(runs, 3) << "at once, after 10 s and after 20 s more";
  EXPECT_TRUE(world.log.contains("Velt activity block occured 'test' at (" + describe(start)));
  EXPECT_EQ(target(), start) << "a run that has not ended keeps its date";
  EXPECT_EQ(world.activities.runsUnderWay(), 0U);
  EXPECT_EQ(world.queues.takeFaults().size(), 1U);
  EXPECT_FALSE(world.log.takeFaults().empty());
}

}  // namespace
}  // namespace kvr
