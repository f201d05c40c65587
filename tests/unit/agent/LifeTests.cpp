#include "agent/StartUp.h"
#include "followup/FollowUpKeys.h"
#include "platform/JSON.h"
#include "platform/simulated/SimulatedPlatform.h"
#include "scheduling/KVROutreachActivity.h"
#include "scheduling/SchedulingKeys.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstdio>
#include <map>
#include <random>

namespace kvr {
namespace {

using ::testing::IsEmpty;

constexpr double kDay = 86400;
constexpr Date kBirth{1'800'000'000};
constexpr const char* kPhone = "PHONE";
constexpr const char* kWatch = "WATCH";
constexpr const char* kLateWatch = "LATE";

/// A device from its first start on: its files, its clock and what the service says outlive the processes.
class Life {
 public:
  explicit Life(std::uint64_t seed) : seed_(seed) {
    offer(kPhone, -1, 12);
    offer(kWatch, 0.25, 20);
    offer(kLateWatch, 8, 30);
  }

  /// When an offer's follow-up is due and when the offer ends, in days from birth.
  void offer(const std::string& serialNumber, double displayed, double ends) {
    offers_[serialNumber] =
        Value::Dictionary{{"zubOfferFollowupDisplayDate", (kBirth + displayed * kDay).secondsSince1970},
                          {"zubOfferEligibleUntil", (kBirth + ends * kDay).secondsSince1970},
                          {"zubLocalizedOfferLabel", "Zub"},
                          {"zubLocalizedOfferSingularDesc", "One day left"},
                          {"zubLocalizedOfferPluralDescFormat", "%@ days left"},
                          {"zubLocalizedOfferCTA", "Add"},
                          {"featureToggleParameters", Value::Dictionary{{"zubOfferDisplay", true}}}};
  }

  /// `pause`: for so many days the device is off before.
  void start(double pause = 0) {
    auto next = std::make_unique<SimulatedPlatform>(++seed_);
    if (platform_) {
      next->files.takeOver(platform_->files);
      next->clock.set(platform_->clock.now() + pause * kDay);
      end();
    } else {
      next->clock.set(kBirth);
    }
    platform_ = std::move(next);
    auto& platform = *platform_;
    platform.accounts.primary = CloudAccount{"alt-dsid"};
    platform.accounts.authentication = AuthenticationAccount{"alternate-dsid"};
    platform.accounts.tokens = {{"com.tarsil.vornic.supportapp.auth", "token"}};
    platform.attestation.preferred =
        SimulatedDeviceAttestation::issued(platform.attestation.key, {std::string(600, 'c')});
    platform.deviceProperties.answers = {{"SerialNumber", kPhone}, {"ProductVersion", systemVersion}};
    platform.activities.boot = systemVersion;
    platform.locale.identifier = locale;
    platform.featureFlags.enabled.insert({"Kavrel", "Bravik_3_0"});
    for (const auto* watch : {kWatch, kLateWatch}) {
      platform.pairedDevices.devices.push_back({watch, {}, watch, kBirth - 100 * kDay, true, false});
    }
    platform.http.handler = [this](const HTTPRequest& request, bool, const SimulatedHTTP::Answer& answer) {
      answer({200, responseTo(request), {}});
    };
    startUp_ = std::make_unique<StartUp>(platform.platform);
  }
  /// Lets the process live; whether it was killed before the time had come.
  bool liveUntil(double days) {
    const auto until = kBirth + days * kDay;
    platform_->queues.after(std::max(until - platform_->clock.now(), 0.0), platform_->queues.mainQueue(),
                            [] {});
    platform_->queues.runUntil(
        [&] { return platform_->files.isKilled() || platform_->clock.now() >= until; });
    return platform_->files.isKilled();
  }
  void end() {
    EXPECT_THAT(platform_->faults(), IsEmpty());
    for (auto& line : platform_->log.texts()) log_.push_back(std::move(line));
    platform_->activities.beginEnding();
    platform_->queues.beginEnding();
    startUp_.reset();
    platform_.reset();
  }

  SimulatedPlatform& platform() { return *platform_; }
  std::vector<std::string> log() {
    end();
    return std::move(log_);
  }
  /// What is to be the same whatever happened on the way: the items shown, less what counts the days; the
  /// bookkeeping; what is scheduled.
  std::string outcome() {
    std::string text;
    const auto pending = platform_->followUps.newClient(kFollowUpClientIdentifier)->pendingItems();
    for (const auto& item : *pending) {
      text += describe(Value(item.userInfo)) + describe(*item.expirationDate) + "\n";
    }
    text += describe(platform_->preferences.objectForKey(preference::kFollowUpPostedHashes)) + "\n";
    for (const auto& key : platform_->preferences.allKeys()) {
      if (key.ends_with(preference::kTargetDateSuffix)) text += key + "\n";
    }
    for (const auto& path : platform_->files.list("/")) {
      if (path.find(".damaged-") != std::string::npos) text += path + "\n";
    }
    return text;
  }

  std::string systemVersion = "17.9";
  std::string locale = "en_US";

 private:
  std::string responseTo(const HTTPRequest& request) const {
    for (const auto& [serialNumber, offer] : offers_) {
      if (request.body.find('"' + serialNumber + '"') != std::string::npos) return *writeJSON(offer);
    }
    return "{ LowServerVersion = 2; HighServerVersion = 3; }";
  }

  std::uint64_t seed_;
  std::map<std::string, Value> offers_;
  std::unique_ptr<SimulatedPlatform> platform_;
  std::unique_ptr<StartUp> startUp_;
  std::vector<std::string> log_;
};

TEST(TheFirstDay, EndsTheSameWhereverTheAgentIsKilled) {
  Life undisturbed(1);
  undisturbed.start();
  ASSERT_FALSE(undisturbed.liveUntil(1));
  const auto expected = undisturbed.outcome();
  const auto writes = undisturbed.platform().files.writeCount();
  EXPECT_THAT(expected, ::testing::HasSubstr(kPhone));
  EXPECT_THAT(expected, ::testing::HasSubstr(kWatch));
  EXPECT_THAT(expected, ::testing::HasSubstr("followuppost.TargetDate"));

  for (std::uint64_t seed = 1; seed <= 100; ++seed) {
    std::mt19937_64 random(seed);
    Life life(1000 * seed);
    for (std::uint64_t kills = 1 + seed % 3; kills > 0; --kills) {
      life.start();
      life.platform().files.killAfterWrites(1 + random() % writes);
      if (!life.liveUntil(0.9)) break;
    }
    life.start();
    ASSERT_FALSE(life.liveUntil(1));
    EXPECT_EQ(life.outcome(), expected) << "seed " << seed;
    EXPECT_THAT(life.platform().log.texts(LogLevel::Error), IsEmpty()) << "seed " << seed;
  }
}

TEST(ABoot, RunsWhatIsOverdueOnce) {
  Life life(1);
  life.start();
  ASSERT_FALSE(life.liveUntil(0.1));
  KVRScheduler::newSchedulerWithActivityDelegate(
      life.platform().platform, std::make_shared<KVROutreachActivity>(life.platform().platform))
      ->scheduleActivityForDate(kBirth + 0.15 * kDay);
  life.systemVersion = "17.10";  // and another boot
  life.start(0.1);
  ASSERT_FALSE(life.liveUntil(0.21));
  const auto& log = life.platform().log;
  EXPECT_EQ(log.count("'com.tarsil.kvragent.outreach' not complete, rescheduling"), 1U);
  EXPECT_EQ(log.count("target reached for 'com.tarsil.kvragent.outreach', trigger activity"), 1U);
}

/// A month with offers that come and go, another language, two upgrades.
std::vector<std::string> logOfAMonth(std::uint64_t seed) {
  Life life(seed);
  life.offer(kLateWatch, -9, -1);  // whose end was missed
  life.start();
  life.liveUntil(4);
  life.platform().locale.identifier = life.locale = "fr_FR";
  life.liveUntil(10);
  life.systemVersion = "17.10";
  life.offer(kLateWatch, 12.5, 26);
  life.start();
  life.liveUntil(21);
  life.systemVersion = "18.0";
  life.start();
  life.liveUntil(30);
  return life.log();
}

/// The times at which the activity ran within a minute of its run before, though nobody else had it
/// scheduled.
std::vector<std::string> hastyRuns(const std::vector<std::string>& log, const std::string& activity,
                                   const std::string& cause) {
  std::vector<std::string> hasty;
  long long last = 0;
  int runs = 0;
  for (const auto& line : log) {
    if (line.find(cause) != std::string::npos) last = 0;
    if (!line.starts_with("Velt activity block occured '" + activity + "'")) continue;
    CalendarTime time{};
    const auto at = line.find("at (");
    EXPECT_EQ(std::sscanf(line.c_str() + at, "at (%lld-%d-%d %d:%d:%d", &time.year, &time.month, &time.day,
                          &time.hour, &time.minute, &time.second),
              6);
    const auto now = secondsSince1970(time);
    if (now - last < 60) hasty.push_back(line);
    last = now;
    ++runs;
  }
  EXPECT_GT(runs, 3) << activity;
  return hasty;
}

TEST(AMonth, NeverRunsAnActivityAgainWithinAMinuteAndIsTheSameForTheSameSeed) {
  const auto log = logOfAMonth(7);
  EXPECT_EQ(logOfAMonth(7), log);
  EXPECT_THAT(hastyRuns(log, "com.tarsil.kvragent.followuppost", "schedule followUp post for"), IsEmpty());
  EXPECT_THAT(hastyRuns(log, "com.tarsil.kvragent.followuprefresh", "Schedule refresh for"), IsEmpty());
  for (const auto* line :
       {"Forcing conversion outreach on upgrade", "Followup present, schedule refresh for",
        "No followups present, don't schedule another refresh", "Device no longer eligible. ",
        "Re-schedule followUp post for", "'com.tarsil.kvragent.followuprefresh' not complete"}) {
    EXPECT_THAT(log, ::testing::Contains(::testing::HasSubstr(line)));
  }
}

}  // namespace
}  // namespace kvr
