#include "core/followup/FollowUpDates.h"
#include "core/followup/KVRFollowUpPost.h"
#include "core/followup/KVRFollowUpRefresh.h"
#include "platform/names/Names.h"
#include "unit/OfferWorld.h"

namespace kvr {
namespace {

struct AFollowUpActivity : AnOfferTest {
  /// A date in days from now, rounded to a thousandth.
  std::optional<double> days(std::optional<Date> date) const {
    if (!date) return std::nullopt;
    return std::round((*date - world.clock.now()) / kDay * 1000) / 1000;
  }
  std::optional<double> targetDays(const char* identifier) { return days(target(identifier)); }
  /// Runs an activity whose device query returns `list`; returns its result.
  template <class Activity>
  std::optional<ActivityResult> runWith(const std::optional<KVRDeviceInfoList>& list) {
    policy = 0;
    return start<Activity>([this, list](std::uint64_t asked, bool, const DeviceInfosAnswer& answer) {
      policy = asked;
      answer(list);
    });
  }

  std::uint64_t policy = 0;  ///< the policy of the last device query
  const Date old = inDays(-100);
};

TEST_F(AFollowUpActivity, FindsTheNextPostDate) {
  const auto off = Dictionary{{"zubOfferEligibleUntil", inDays(-1).secondsSince1970}};
  world.preferences.setObject(Array{sha256Hash("posted")}, preference::kFollowUpPostedHashes);
  const std::tuple<KVRDeviceInfoList, std::optional<double>> cases[] = {
      {{}, {}},
      {{info("A", shownInDays(5, 30), old), info("B", shownInDays(3, 30), old)}, 3},
      {{info("A", shownInDays(4, 2), old)}, 2},
      {{info("A", shownInDays(4, -2), old), info("B", shownInDays(3, -5), old)}, -2},  // the scan ends here
      {{info("posted", shownInDays(3, -5), old), info("B", off), info("C", {})}, {}},
      {{info("A", shownInDays(3, 30), inDays(6))}, 6},
      {{info("A", shownInDays(-3, 30))}, {}},  // an unknown activation date counts as now
      {{info("A", shownInDays(3, 30))}, 3},
      {{info("A", offer(30), inDays(7))}, 7},  // not the end minus the duration
      {{info("A", offer(30), old)}, {}}};
  for (const auto& [list, next] : cases) {
    const auto found = KVRFollowUpPost::nextFollowUpPostDateWithDevicesInfo(world.platform, list);
    EXPECT_EQ(days(found), next) << describe(list);
  }
}

TEST_F(AFollowUpActivity, FindsTheNextRefreshDate) {
  const std::tuple<KVRDeviceInfoList, std::optional<double>, double> cases[] = {
      {{}, {}, 1},
      {{info("A", shownInDays(-1, 2.5), old)}, 0.5, 0.5},
      {{info("A", shownInDays(-1, 10. / 24), old)}, {}, 0.417},
      {{info("A", shownInDays(3, 20), old)}, 3, 1},
      {{info("A", shownInDays(0.25, 20), old)}, 0.25, 0.25},
      {{info("A", shownInDays(-1, 20.75), old), info("B", shownInDays(-1, 3.25), old)}, 0.25, 0.25},
      {{info("A", offer(-1), old), info("B", shownInDays(-1, 2.5), old)}, -1, -1},  // the scan ends here
      {{info("A", Dictionary{}), info("B", {})}, {}, 1},
      {{info("A", offer(2.5))}, {}, 0.5},  // without a display date
  };
  const auto next = [&](const KVRDeviceInfoList& list, bool isInitial) {
    return days(KVRFollowUpRefresh::nextFollowUpRefreshDateWithDevicesInfo(world.platform, list, isInitial));
  };
  for (const auto& [list, initial, otherwise] : cases) {
    EXPECT_EQ(next(list, true), initial) << describe(list);
    EXPECT_EQ(next(list, false), otherwise) << describe(list);
  }
}

TEST_F(AFollowUpActivity, PostsAndSchedulesWhatFollows) {
  const std::string perform = "-[KVRFollowUpPost performActivityForScheduler:withCompletionHandler:]";
  const auto one = [&](const Dictionary& warranty, const char* serialNumber = "A") {
    return KVRDeviceInfoList{info(serialNumber, warranty, old)};
  };
  using Days = std::optional<double>;
  const std::tuple<std::optional<KVRDeviceInfoList>, Days, Days> cases[] = {
      {std::nullopt, {}, {}},
      {KVRDeviceInfoList{}, {}, {}},
      {one(shownInDays(2, 30)), 2, {}},
      {one(shownInDays(-2, 2.5)), {}, 0.5},
      {one(shownInDays(-2, 0.25)), {}, 0.25},
      {one(offer(-1), "B"), 1, {}},  // never back to back
      {KVRDeviceInfoList{info("B", offer(-1), old), info("C", shownInDays(0.25, 30), old)}, 0.25, {}},
      {KVRDeviceInfoList{info("B", offer(-1), old), info("C", shownInDays(4, 30), old)}, 1, {}},
  };
  for (const auto& [list, post, refresh] : cases) {
    KVRScheduler::clearScheduledActivities(world.platform);
    world.log.clear();
    EXPECT_EQ(runWith<KVRFollowUpPost>(list), list ? ActivityResult::Finished : ActivityResult::Deferred);
    EXPECT_EQ(policy, 2U);
    EXPECT_EQ(targetDays(names::kFollowUpPost), post);
    EXPECT_EQ(targetDays(names::kFollowUpRefresh), refresh);
    EXPECT_EQ(world.log.count(perform + " -> " + describe(list)), 1U);
    EXPECT_EQ(world.log.count("Unable to load devices info, defer"), list ? 0U : 1U);
    EXPECT_EQ(world.log.contains(perform + ": Re-schedule followUp post for: "), post.has_value());
    EXPECT_EQ(world.log.contains(perform + ": Schedule refresh for: "), refresh.has_value());
  }
}

TEST_F(AFollowUpActivity, SchedulesWhatComesDueWhileOthersArePosted) {
  const KVRDeviceInfoList list{info("B", shownInDays(0.001, 30), old), info("A", due(30), old)};
  const auto displayDate = list[0]->warranty()->zubOfferFollowupDisplayDate();
  world.files.whenChanged([this, displayDate](const std::string& path, bool) {
    if (path.find("/FollowUps/") != std::string::npos) world.clock.set(*displayDate + 1);
  });
  runWith<KVRFollowUpPost>(list);
  EXPECT_THAT(pendingSerials(), ElementsAre("A"));
  EXPECT_EQ(target(names::kFollowUpPost), displayDate);
}

TEST_F(AFollowUpActivity, RefreshesAtOnceWhenACountDropsWhileItIsWritten) {
  const KVRDeviceInfoList list{info("A", due(2.5), old)};
  Date drop = *list[0]->warranty()->zubOfferEligibleUntil() - 2 * kDay;
  world.files.whenChanged([this, &drop](const std::string& path, bool) {
    if (path.find("/FollowUps/") != std::string::npos) world.clock.set(drop + 1);
  });
  runWith<KVRFollowUpPost>(list);
  EXPECT_EQ(target(names::kFollowUpRefresh), drop);
  drop = drop + kDay;
  world.clock.set(drop - kDay / 4);
  runWith<KVRFollowUpRefresh>(list);
  EXPECT_EQ(pending()[0].informativeFooterText, Value("2 days left"));
  EXPECT_EQ(target(names::kFollowUpRefresh), drop);
  world.files.whenChanged(nullptr);
}

TEST_F(AFollowUpActivity, DropsTheAnswerOfAPostRunThatWasDeferredMeanwhile) {
  std::vector<DeviceInfosAnswer> held;
  const auto post = std::make_shared<KVRFollowUpPost>(
      world.platform, [&](std::uint64_t, bool, const DeviceInfosAnswer& answer) { held.push_back(answer); });
  KVRScheduler::newSchedulerWithActivityDelegate(world.platform, post)->scheduleActivityForDate(inDays(-1));
  world.queues.run();
  ASSERT_EQ(held.size(), 1U);
  world.activities.setNetworkReachable(false);
  world.queues.advance(2e9 + 10);
  EXPECT_EQ(world.log.count("FollowUp Post activity deferred."), 1U);
  EXPECT_EQ(post->followUpPostTimer(), nullptr);
  held[0](KVRDeviceInfoList{info("A", due(5), inDays(-9))});
  EXPECT_THAT(pendingSerials(), ElementsAre("A")) << "the work is done all the same";
  EXPECT_EQ(world.log.count("activity run was answered already, result 1 dropped"), 1U);
  EXPECT_TRUE(target("com.tarsil.kvragent.followuppost").has_value());
}

TEST_F(AFollowUpActivity, PutsOffOnlyARefreshThatDoesNotLieAhead) {
  const Date now = world.clock.now();
  const std::tuple<double, double, double> cases[] = {{0.5, 86400, 0.5}, {0, 86400, 60},     {-5, 86400, 60},
                                                      {-5, 14400, 10},   {-5, 10, 1},        {0.5, 10, 0.5},
                                                      {0, 0, 60},        {0.001, 0.1, 60},   {90, -5, 90},
                                                      {-5, -5, 60},      {1, -kInfinity, 60}};
  for (const auto& [next, day, expected] : cases) {
    EXPECT_EQ(followingRefreshDate(now + next, now, day) - now, expected) << next << " of a day of " << day;
  }
}

TEST_F(AFollowUpActivity, RefreshesForAsLongAsAnythingIsShown) {
  EXPECT_EQ(runWith<KVRFollowUpRefresh>({{info("A", due(2.5))}}), ActivityResult::Finished);
  EXPECT_EQ(world.log.count("No followups present, don't schedule another refresh"), 1U);
  EXPECT_EQ(targetDays(names::kFollowUpRefresh), std::nullopt);

  const KVRDeviceInfoList shown{info("A", due(2.5), inDays(-9))};
  runWith<KVRFollowUpPost>(shown);
  for (const double day : {86400., 0., -5., 1e-3}) {
    world.preferences.setObject(day, preference::kOneDayInterval);
    EXPECT_EQ(runWith<KVRFollowUpRefresh>(shown), ActivityResult::Finished);
    EXPECT_EQ(policy, 1U);
    EXPECT_GE(targetDays(names::kFollowUpRefresh), day > 60 ? 0.5 : std::round(60 / kDay * 1000) / 1000);
  }
  EXPECT_TRUE(world.log.contains("Schedule next refresh for " + describe(inDays(0.5))));
  EXPECT_EQ(runWith<KVRFollowUpRefresh>(std::nullopt), ActivityResult::Deferred);
  EXPECT_EQ(world.log.count("Unable to load device info for followup refresh, defer"), 1U);
}

}  // namespace
}  // namespace kvr
