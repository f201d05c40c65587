#include "Prelude.h"
#include "platform/stores/ActivityTable.h"

namespace kvr {
namespace {

constexpr auto kFinished = ActivityResult::Finished;
constexpr auto kDeferred = ActivityResult::Deferred;
const ActivityBlock kBlock = [](const ActivityHandler&) {};

struct AnActivityTable : ::testing::Test {
  /// The identifiers of the activities that start now.
  std::vector<std::string> started() {
    std::vector<std::string> names;
    for (auto& run : table.takeDue(now)) {
      names.push_back(run.identifier);
      numbers[run.identifier] = run.number;
    }
    return names;
  }
  ActivityTable::Registered add(const std::string& name, const ActivityCriteria& criteria, double draw = 0,
                                RegistrationCause cause = RegistrationCause::Demand) {
    return table.add(name, criteria, cause, kBlock, now, draw);
  }
  ActivityTable::Ending end(const std::string& name, ActivityResult result) {
    return table.end(name, numbers[name], result, now);
  }
  void pass(double seconds) {
    now.date = now.date + seconds;
    now.uptime += seconds;
  }
  /// Lets time pass until an activity is due.
  std::vector<std::string> next() {
    pass(table.secondsToNext(now).value());
    return started();
  }

  ActivityTable table;
  ActivityTable::Now now{Date{1'790'000'000}, 100, true};
  std::map<std::string, std::uint64_t> numbers;
};

TEST_F(AnActivityTable, RunsAnActivityOnceAtThePointDrawnInItsWindow) {
  const std::tuple<ActivityCriteria, double, double> cases[] = {
      {{0, 0}, 0.5, 0}, {{3600, 360}, 0, 3600}, {{3600, 360}, 0.5, 3780}, {{-5, -5}, 0.5, 0}};
  for (const auto& [criteria, draw, due] : cases) {
    add("a", criteria, draw);
    EXPECT_THAT(table.secondsToNext(now), Optional(due));
    EXPECT_TRUE(due == 0 || started().empty());
    EXPECT_THAT(next(), ElementsAre("a"));
    EXPECT_TRUE(end("a", kFinished).changesTree);
    EXPECT_EQ(table.secondsToNext(now), std::nullopt);
    EXPECT_FALSE(table.isRegisteredFor("a", now.date));
  }
}

TEST_F(AnActivityTable, SharesAWakeUpBetweenOverlappingWindows) {
  add("early", {100, 50}, 0.8);
  add("late", {120, 500}, 0.9);
  add("apart", {200, 0});
  EXPECT_THAT(next(), ElementsAre("early", "late"));
  EXPECT_THAT(table.secondsToNext(now), Optional(60.0));
}

TEST_F(AnActivityTable, WaitsForTheNetworkThatAnActivityNeeds) {
  add("remote", {10, 0, true});
  now.networkReachable = false;
  EXPECT_EQ(table.secondsToNext(now), std::nullopt);
  pass(1000);
  EXPECT_THAT(started(), IsEmpty());
  now.networkReachable = true;
  EXPECT_THAT(started(), ElementsAre("remote"));
  // Deferred because it went away: at once when it is back, however often.
  for (int i = 0; i < 3; ++i) {
    now.networkReachable = false;
    table.noticeNetworkLoss();
    pass(1);
    end("remote", kDeferred);
    EXPECT_EQ(table.secondsToNext(now), std::nullopt);
    now.networkReachable = true;
    EXPECT_THAT(started(), ElementsAre("remote"));
  }
}

TEST_F(AnActivityTable, BacksOffFromTenSecondsToAnHour) {
  add("a", {});
  EXPECT_THAT(started(), ElementsAre("a"));
  for (const double wait : {10, 20, 40, 80, 160, 320, 640, 1280, 2560, 3600, 3600}) {
    // That it is deferred is news once.
    EXPECT_EQ(end("a", kDeferred).changesTree, wait == 10);
    EXPECT_EQ(table.tree()["lastRuns"]["a"]["endedDate"], Value(now.date));
    EXPECT_THAT(table.secondsToNext(now), Optional(wait));
    now.date = now.date + 315'360'000;  // a moved clock shortens no wait
    EXPECT_THAT(table.secondsToNext(now), Optional(wait));
    EXPECT_THAT(next(), ElementsAre("a"));
  }
  // A new registration counts afresh.
  add("a", {});
  end("a", kDeferred);
  EXPECT_THAT(started(), ElementsAre("a"));
}

TEST_F(AnActivityTable, RunsAgainAtTheDateADeferredRunWaitsFor) {
  add("a", {});
  EXPECT_THAT(started(), ElementsAre("a"));
  table.setEarliestDate("a", now.date + 500, now);
  pass(1);
  end("a", kDeferred);
  EXPECT_THAT(table.secondsToNext(now), Optional(499.0));
  now.date = now.date - 86400;  // the date keeps its meaning
  EXPECT_THAT(table.secondsToNext(now), Optional(499.0 + 86400));
  now.date = now.date + 315'360'000;
  EXPECT_THAT(started(), ElementsAre("a"));
  // A date that is not in the future, or is NaN, has no effect.
  table.setEarliestDate("a", now.date - 10, now);
  table.setEarliestDate("a", Date{std::numeric_limits<double>::quiet_NaN()}, now);
  end("a", kDeferred);
  EXPECT_THAT(table.secondsToNext(now), Optional(10.0));
  EXPECT_THAT(next(), ElementsAre("a"));
  table.setEarliestDate("a", now.date + 0.001, now);  // repeated without end, this must not spin
  end("a", kDeferred);
  EXPECT_THAT(table.secondsToNext(now), Optional(::testing::DoubleNear(ActivityTable::kShortestCycle, 1e-6)));
}

TEST_F(AnActivityTable, SpacesOutWhatReactionsRegisterAgainAndAgainAndNothingElse) {
  const auto react = [&] { return add("a", {}, 0, RegistrationCause::Reaction).heldUntil; };
  const double start = now.uptime;
  std::vector<Date> told;
  for (int run = 0; run < 20; ++run) {
    for (int times = 0; times < 3; ++times) {
      if (const auto heldUntil = react()) told.push_back(*heldUntil);
    }
    const Value held = table.tree()["activities"]["a"]["heldUntilDate"];
    EXPECT_EQ(held.isNull(), *table.secondsToNext(now) == 0) << "the file says so while it waits";
    EXPECT_THAT(next(), ElementsAre("a"));
    if (const auto heldUntil = react()) told.push_back(*heldUntil);  // registered by the run itself
    pass(1);
    EXPECT_THAT(started(), IsEmpty());
    end("a", kFinished);
  }
  EXPECT_NEAR(now.uptime - start, 3 * ActivityTable::kStartsPeriod, 30);
  EXPECT_THAT(told, SizeIs(21 - ActivityTable::kMostStarts))
      << "once for each run, however often it is registered";

  add("a", {700, 0}, 0, RegistrationCause::Reaction);
  EXPECT_THAT(table.secondsToNext(now), Optional(700.0)) << "a date that comes later anyway";
  for (int run = 0; run < 20; ++run) {
    EXPECT_EQ(add("a", {}).heldUntil, std::nullopt);
    EXPECT_THAT(started(), ElementsAre("a")) << "on demand, without a wait";
    end("a", kFinished);
  }
}

TEST_F(AnActivityTable, DoesNotCountRunsThatTheirOwnDateDefers) {
  for (std::size_t run = 0; run < ActivityTable::kMostStarts; ++run) {
    EXPECT_EQ(add("a", {}, 0, RegistrationCause::Reaction).heldUntil, std::nullopt);
    EXPECT_THAT(started(), ElementsAre("a"));
    table.setEarliestDate("a", now.date + 0.7, now);
    pass(1);
    end("a", kDeferred);
    EXPECT_THAT(started(), ElementsAre("a"));
    end("a", kFinished);
  }
  EXPECT_NE(add("a", {}, 0, RegistrationCause::Reaction).heldUntil, std::nullopt);
}

TEST_F(AnActivityTable, TakesUpItsTreeAgainAndKeepsWhatNobodyChecksInFor) {
  add("a", {3600, 360, true}, 0.5);
  add("b", {60, 0});
  ActivityTable next;
  next.adopt(table.tree());
  EXPECT_EQ(next.tree(), table.tree());
  EXPECT_EQ(next.secondsToNext(now), std::nullopt);
  next.checkIn("a", kBlock);
  EXPECT_THAT(next.secondsToNext(now), Optional(3780.0));
  EXPECT_TRUE(next.isRegisteredFor("b", now.date + 60));
  const Date earlier = now.date + 20;
  pass(120);
  EXPECT_FALSE(next.isRegisteredFor("b", earlier)) << "though both have passed";
}

TEST_F(AnActivityTable, ComplainsOfATreeThatIsNotItsOwn) {
  add("a", {1, 2});
  auto entry = table.tree()["activities"]["a"].dictionary();
  const auto with = [&entry](const char* key, const Value& value) {
    auto changed = entry;
    changed.insert_or_assign(key, value);
    return Value(Dictionary{{"activities", Dictionary{{"a", changed}}}});
  };
  EXPECT_EQ(ActivityTable::complaintAbout(table.tree()), std::nullopt);
  EXPECT_EQ(ActivityTable::complaintAbout(Dictionary{}), std::nullopt);
  for (const auto& tree : {Value(Dictionary{{"activities", 1}}), with("delay", "x"), with("dueDate", Value()),
                           with("registeredDate", Date{kInfinity}), with("requiresNetwork", 7)}) {
    EXPECT_TRUE(ActivityTable::complaintAbout(tree)) << describe(tree);
  }
}

TEST_F(AnActivityTable, ServesTheBootBeforeTheUpgradeAndRecordsEachAtItsEnd) {
  EXPECT_TRUE(table.noticeBoot("boot", "one")) << "the first boot is only recorded";
  EXPECT_THAT(started(), IsEmpty());
  table.checkIn("upgrade", kBlock);
  table.noticeSystemVersion("upgrade", "17.1", false);
  table.checkIn("boot", kBlock);
  EXPECT_FALSE(table.noticeBoot("boot", "two"));
  EXPECT_THAT(started(), ElementsAre("boot"));
  end("boot", kDeferred);
  add("overdue", {});
  EXPECT_THAT(started(), ElementsAre("overdue")) << "a run that failed holds up nothing but its successor";
  end("overdue", kFinished);
  EXPECT_THAT(next(), ElementsAre("boot"));
  add("overdue", {});
  EXPECT_THAT(started(), IsEmpty()) << "nothing else meanwhile";
  EXPECT_EQ(table.tree()["bootIdentifier"], Value("one"));
  EXPECT_TRUE(end("boot", kFinished).servesOccasion);
  EXPECT_EQ(table.tree()["bootIdentifier"], Value("two"));
  EXPECT_THAT(started(), ElementsAre("upgrade"));
  EXPECT_TRUE(table.tree()["OSVersion"].isNull());
  end("upgrade", kFinished);
  EXPECT_EQ(table.tree()["OSVersion"], Value("17.1"));
  EXPECT_THAT(started(), ElementsAre("overdue"));
}

TEST_F(AnActivityTable, RunsTheUpgradeForAnotherVersionAndWhenARunIsOwed) {
  using Version = std::optional<std::string>;
  const std::tuple<Version, bool, bool, const char*> cases[] = {
      {{}, false, true, ""},          {{}, false, false, ""},       {"17.1", false, true, "17.1"},
      {"17.1", false, false, "17.1"}, {"17.1", true, true, "17.1"}, {"17.2", true, true, "17.2"},
      {{}, false, false, "17.2"},     {{}, true, true, "17.2"}};
  for (const auto& [version, isOwed, runs, recorded] : cases) {
    table.checkIn("upgrade", kBlock);
    table.noticeSystemVersion("upgrade", version, isOwed);
    EXPECT_EQ(started().size(), runs ? 1U : 0U);
    end("upgrade", kFinished);
    EXPECT_EQ(table.tree()["OSVersion"], Value(recorded));
  }
}

}  // namespace
}  // namespace kvr
