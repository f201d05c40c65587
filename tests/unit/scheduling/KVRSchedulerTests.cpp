#include "scheduling/KVRScheduler.h"
#include "unit/SimulatedTest.h"

namespace kvr {
namespace {

using ::testing::ElementsAre;

constexpr const char* kKey = "test.TargetDate";

/// Does what the test says.
class FakeActivity : public KVRSchedulerActivityDelegate {
 public:
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

class AScheduler : public SimulatedTest {
 protected:
  const std::shared_ptr<FakeActivity> activity = std::make_shared<FakeActivity>();
  const std::shared_ptr<KVRScheduler> scheduler =
      KVRScheduler::newSchedulerWithActivityDelegate(simulated.platform, activity);
  const Date start = simulated.clock.now();

  std::optional<Date> target() { return simulated.preferences.dateForKey(kKey); }
  Value registration() {
    return simulated.files.getPropertyList(
        "/home/user/Library/Activities/com.tarsil.kvragent.plist")["activities"]["test"];
  }
  std::vector<std::string> newLines() {
    auto lines = simulated.log.texts();
    simulated.log.clear();
    return lines;
  }
};

TEST_F(AScheduler, RegistersDelaysInWholeSecondsAndKeepsTheDateAsItIs) {
  const struct {
    double delay;
    int criterion;
    int grace;
  } cases[] = {{3600, 3600, 360}, {86400, 86400, 8640}, {15, 15, 1}, {9.9, 9, 0}, {-300, 0, 0}, {0, 0, 0}};
  for (const auto& test : cases) {
    for (const bool byDate : {true, false}) {
      activity->network = byDate;
      newLines();
      if (byDate) {
        scheduler->scheduleActivityForDate(start + test.delay);
      } else {
        scheduler->scheduleActivityWithDelay(test.delay);
      }
      EXPECT_EQ(target(), start + test.delay);
      EXPECT_EQ(registration()["delay"], Value(test.criterion));
      EXPECT_EQ(registration()["gracePeriod"], Value(test.grace));
      EXPECT_EQ(registration()["requiresNetwork"], Value(byDate));
      EXPECT_THAT(newLines(), ElementsAre(format("scheduled 'test' with delay: %.02f (%@)",
                                                 (start + test.delay) - start, start + test.delay)));
    }
  }
  scheduler->scheduleActivityForDate(std::nullopt);
  EXPECT_EQ(target(), std::nullopt);
  EXPECT_THAT(newLines(), ElementsAre("scheduled 'test' with delay: 0.00 ((null))"));
}

TEST_F(AScheduler, LetsTheDelegateRunFromTheTargetDateOn) {
  const struct {
    std::optional<double> target;
    bool runs;
  } cases[] = {{std::nullopt, true}, {-1, true}, {0, true}, {90, false}};
  for (const auto& test : cases) {
    simulated.preferences.setObject(test.target ? Value(simulated.clock.now() + *test.target) : Value(),
                                    kKey);
    const auto before = target();
    const auto asked = simulated.clock.now();
    newLines();
    std::optional<Date> answered;
    std::optional<ActivityResult> result;
    scheduler->performScheduledOutreachWithBlock(
        ActivityHandler(simulated.log, "test", [&](ActivityResult it) {
          result = it;
          answered = simulated.clock.now();
        }));
    EXPECT_EQ(target(), test.runs ? std::nullopt : before) << "at once";
    EXPECT_THAT(newLines(), ElementsAre(format("activity for 'test' should occur on: %@", before),
                                        test.runs ? "target reached for 'test', trigger activity"
                                                  : "target not past for 'test', defer for: 90.00"));
    simulated.queues.advance(5);
    EXPECT_EQ(result, test.runs ? ActivityResult::Finished : ActivityResult::Deferred);
    EXPECT_EQ(answered, asked + 1);
  }
}

TEST_F(AScheduler, KeepsTheDateOfADeferredRunAndOneStoredDuringTheRun) {
  std::vector<double> runs;
  activity->work = [&](const ActivityHandler& handler) {
    runs.push_back(simulated.clock.now() - start);
    if (runs.size() == 1) {
      handler(ActivityResult::Deferred);
      EXPECT_EQ(target(), start + 60);
      return;
    }
    if (runs.size() == 2) scheduler->scheduleActivityForDate(start + 1000);
    handler(ActivityResult::Finished);
    EXPECT_EQ(target(), runs.size() == 2 ? std::optional(start + 1000) : std::nullopt);
  };
  scheduler->scheduleActivityForDate(start + 60);
  simulated.queues.advance(5000);
  ASSERT_EQ(runs.size(), 3U);
  EXPECT_LE(runs[1], 100);
  EXPECT_GE(runs[2], 1000);
  EXPECT_TRUE(
      simulated.log.contains("Velt activity block occured 'test' at (" + describe(start + 60).substr(0, 16)));
}

TEST_F(AScheduler, WaitsOutAClockThatIsMovedBack) {
  std::optional<Date> ran;
  activity->work = [&](const ActivityHandler& handler) {
    ran = simulated.clock.now();
    handler(ActivityResult::Finished);
  };
  scheduler->scheduleActivityForDate(start + 600);
  simulated.clock.moveBy(-3600);
  simulated.queues.advance(4000);
  EXPECT_EQ(ran, std::nullopt);
  simulated.queues.advance(1000);
  ASSERT_TRUE(ran.has_value());
  EXPECT_GE(*ran, start + 600);
}

TEST_F(AScheduler, ClearsEveryTargetDateAndNothingElse) {
  for (const char* key : {"a.TargetDate", "b.TargetDate", "c.TargetDate.x", ".TargetDatex"}) {
    simulated.preferences.setObject(start, key);
  }
  KVRScheduler::clearScheduledActivities(simulated.platform);
  EXPECT_THAT(simulated.preferences.allKeys(), ElementsAre(".TargetDatex", "c.TargetDate.x"));
  EXPECT_THAT(newLines(), ElementsAre("Clearing a.TargetDate", "Clearing b.TargetDate"));
}

TEST_F(AScheduler, ComesBackToARunWhoseWorkFailsOrDropsItsAnswer) {
  int runs = 0;
  activity->work = [&](const ActivityHandler&) {
    if (++runs == 2) throw std::runtime_error("no answer");
  };
  scheduler->scheduleActivityForDate(start);
  simulated.queues.advance(35);
  EXPECT_EQ(runs, 3) << "at once, after 10 s and after 20 s more";
  EXPECT_EQ(simulated.activities.runsUnderWay(), 0U);
  EXPECT_EQ(simulated.queues.takeFaults().size(), 1U);
  EXPECT_FALSE(simulated.log.takeFaults().empty());
}

}  // namespace
}  // namespace kvr
