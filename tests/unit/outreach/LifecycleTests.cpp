#include "core/agent/AgentKeys.h"
#include "core/outreach/KVRConversionOutreachActivity.h"
#include "core/outreach/KVROutreachActivity.h"
#include "core/outreach/KVRPostBootActivity.h"
#include "core/outreach/KVRPostUpgradeActivity.h"
#include "platform/codec/JSON.h"
#include "platform/names/Names.h"
#include "unit/OfferWorld.h"

namespace kvr {
namespace {

/// Runs the agent's activities; the coverage service answers from a table.
struct TheAgentsLife : AnOfferTest {
  std::map<std::string, Value> warranties;  ///< by serial number; other downloads fail

  TheAgentsLife() {
    world.coverage = [this](const HTTPRequest& request) {
      const auto found = warranties.find((*readJSON(request.body))["serialNumber"].string());
      if (found == warranties.end() || found->second.isNull()) return HTTPResponse{500, {}, {}};
      return HTTPResponse{200, *writeJSON(found->second), {}};
    };
  }
  void setTarget(const char* identifier, Date date) {
    world.preferences.setObject(date, std::string(identifier) + ".TargetDate");
  }
  template <class Activity>
  std::optional<ActivityResult> run() {
    world.log.clear();
    start<Activity>();
    world.queues.runUntil([this] { return result.has_value(); });
    return result;
  }
};

TEST_F(TheAgentsLife, SchedulesThePostAtTheEarliestDateOfAnOutreach) {
  const auto excluded = with({{"zubOfferToggle", Array{"00101"}}}, shownInDays(1, 20));
  const auto lasting = with({{"zubOfferDurationDaysBeforeEndDate", 15}}, offer(20));
  const Value off = Dictionary{}, none;
  const Value in3 = shownInDays(3, 20), in10 = shownInDays(10, 20), before = shownInDays(-4, 20);
  const std::tuple<Value, Value, std::optional<double>> cases[] = {
      {in10, in3, 3},   {in10, lasting, 5}, {excluded, in3, 3},  {off, before, -4},
      {none, in10, 10}, {none, none, {}},   {excluded, off, {}},
  };
  world.pair("W", inDays(-100));
  world.carriers.carriers = {{"1", {}}, {"2", {"001", "01"}}};
  for (const auto& [phone, watch, days] : cases) {
    for (const bool conversion : {false, true}) {
      KVRScheduler::clearScheduledActivities(world.platform);
      warranties = {{"LOCAL", phone}, {"W", watch}};
      const auto expected = days ? std::optional(inDays(*days)) : std::nullopt;
      const auto outcome = days ? "Complete activity and schedule followUp post for: " + describe(expected)
                                : "No devices eligible for followUp posts";
      EXPECT_EQ(conversion ? run<KVRConversionOutreachActivity>() : run<KVROutreachActivity>(),
                ActivityResult::Finished);
      EXPECT_EQ(target(names::kFollowUpPost), expected);
      EXPECT_EQ(world.log.count(format("Conversion: %d -- %@", conversion, outcome)), 1U);
      EXPECT_EQ(world.log.count("carrier matched"), phone == Value(excluded) ? 1U : 0U);
      EXPECT_EQ(world.log.count("Warranty failed to download"),
                (phone.isNull() ? 1U : 0U) + (watch.isNull() ? 1U : 0U));
    }
  }
  for (const std::string line :
       {"serialNumber: W success: 1 -- Conversion: 1", "Warranty downloaded successfully",
        "Coverage check shows device should display Zub offer, check on-device state",
        "Configuration does not support current device. Complete activity without scheduling followup",
        "Warranty shows device is ineligible, complete activity without scheduling followup",
        "carrierID: (null)", "carrierID: 00101"}) {
    EXPECT_EQ(world.log.count(line), line.starts_with("Warranty down") ? 2U : 1U) << line;
  }
  EXPECT_THAT(world.log.texts(LogLevel::Error),
              Contains("No mobileCountryCode for networkInfo: {1 = (null)/(null); 2 = 001/01; }, carrier: "
                       "(null)/(null)"));
}

TEST_F(TheAgentsLife, DefersAnOutreachThatTheEndOfTheProcessCutsShort) {
  world.coverage = [this](const HTTPRequest&) {
    world.cleanExit.beginEnding();
    return HTTPResponse{500, {}, {}};
  };
  EXPECT_EQ(run<KVROutreachActivity>(), ActivityResult::Deferred);
}

TEST_F(TheAgentsLife, BeginsWithTheFirstPostUpgradeRun) {
  for (const bool hasAccount : {true, false}) {
    if (!hasAccount) world.accounts.primary.reset();
    for (const char* key :
         {preference::kPostUpgradeActivityCompleted, preference::kInitialOutreachActivityScheduled}) {
      world.preferences.removeObject(key);
    }
    setTarget("old", inDays(3));
    EXPECT_EQ(run<KVRPostBootActivity>(), ActivityResult::Finished);
    EXPECT_EQ(world.log.count("post upgrade activity hasn't yet been performed, skip boot activity"), 1U);
    EXPECT_EQ(run<KVRPostUpgradeActivity>(), ActivityResult::Finished);
    EXPECT_EQ(target("old"), std::nullopt);
    EXPECT_EQ(world.preferences.dateForKey("DefaultDeviceActivationDate"), world.clock.now());
    EXPECT_EQ(target(names::kOutreach), hasAccount ? std::optional(world.clock.now()) : std::nullopt);
    EXPECT_EQ(world.preferences.boolForKey(preference::kInitialOutreachActivityScheduled), hasAccount);
    EXPECT_TRUE(world.preferences.boolForKey(preference::kPostUpgradeActivityCompleted));
    EXPECT_EQ(world.preferences.stringForKey(preference::kPostUpgradeOSVersion), "17.9");
    const auto* const alone =
        "No primary account detected. Finishing post upgrade activity without scheduling outreach";
    EXPECT_EQ(world.log.count(alone), hasAccount ? 0U : 1U);
    KVRScheduler::clearScheduledActivities(world.platform);
  }
}

TEST_F(TheAgentsLife, ForcesAConversionOutreachWhenTheOSVersionHasGoneUp) {
  const std::tuple<std::optional<std::string>, std::optional<std::string>, bool, bool> cases[] = {
      {"17.9", "17.10", false, true},  {"17.9", "17.10", true, false},  {"17.9", "17.9", false, false},
      {"17.10", "17.9", false, false}, {"17.9", "17.09", false, false}, {{}, "17.9", false, true},
      {"17.9", {}, false, false},      {"17", "17.0.1", false, true}};
  world.preferences.setObject(true, preference::kPostUpgradeActivityCompleted);
  for (const auto& [before, current, outreachPending, forces] : cases) {
    KVRScheduler::clearScheduledActivities(world.platform);
    world.preferences.setObject(before, preference::kPostUpgradeOSVersion);
    world.deviceProperties.answers.erase("ProductVersion");
    if (current) world.deviceProperties.answers["ProductVersion"] = *current;
    if (outreachPending) setTarget(names::kOutreach, inDays(1));
    EXPECT_EQ(run<KVRPostUpgradeActivity>(), ActivityResult::Finished);
    EXPECT_EQ(target(names::kConversionOutreach).has_value(), forces);
    EXPECT_EQ(world.log.count(forces ? "Forcing conversion outreach on upgrade"
                                     : "post upgrade activity already performed"),
              1U);
    EXPECT_EQ(world.preferences.stringForKey(preference::kPostUpgradeOSVersion), current ? current : before);
    EXPECT_EQ(world.log.count("Unable to get OS version"), current ? 0U : 1U);
  }
}

TEST_F(TheAgentsLife, RegistersAgainAfterABootWhatIsPendingAndNothingElse) {
  world.preferences.setObject(true, preference::kPostUpgradeActivityCompleted);
  setTarget(names::kConversionOutreach, inDays(-2));
  setTarget(names::kFollowUpRefresh, inDays(4));
  setTarget(names::kFollowUpPost, inDays(4));
  EXPECT_EQ(run<KVRPostBootActivity>(), ActivityResult::Finished);
  EXPECT_EQ(world.preferences.dateForKey(preference::kConversionOutreachScheduledDate), inDays(-2));
  const std::string conversion = names::kConversionOutreach, refresh = names::kFollowUpRefresh;
  EXPECT_THAT(world.log.texts(),
              ElementsAre("'" + conversion + "' not complete, rescheduling",
                          format("scheduled '%@' with delay: -172800.00 (%@)", conversion, inDays(-2)),
                          "'" + refresh + "' not complete, rescheduling",
                          format("scheduled '%@' with delay: 345600.00 (%@)", refresh, inDays(4))));
}

TEST_F(TheAgentsLife, MovesTheConversionOutreachToEarlierDatesOnly) {
  world.preferences.setObject(true, preference::kPostUpgradeActivityCompleted);
  const std::tuple<std::optional<double>, double, const char*> cases[] = {
      {50, 50, "scheduling conversion outreach %"},    {60, 50, ""}, {{}, 50, ""}, {40, 50, ""},
      {30, 30, "Re-scheduling conversion outreach %"}, {30, 30, ""}};
  // A warranty without a date does not schedule, and neither does one with a later date.
  for (const auto& [days, scheduled, said] : cases) {
    Dictionary warranty;
    if (days) warranty["zubOfferConversionDate"] = inDays(*days).secondsSince1970;
    warranties["LOCAL"] = warranty;
    run<KVROutreachActivity>();
    EXPECT_EQ(target(names::kConversionOutreach), inDays(scheduled));
    EXPECT_EQ(world.preferences.dateForKey(preference::kConversionOutreachScheduledDate), inDays(scheduled));
    std::string line = said;
    if (!line.empty()) line.replace(line.size() - 1, 1, describe(inDays(scheduled)));
    EXPECT_EQ(world.log.contains("cheduling conversion outreach"), !line.empty());
    EXPECT_EQ(world.log.count(line), line.empty() ? 0U : 1U);
  }
}

}  // namespace
}  // namespace kvr
