#include "followup/KVRFollowUp.h"
#include "unit/followup/OfferWorld.h"

namespace kvr {
namespace {

using ::testing::ElementsAre;
using ::testing::IsEmpty;
using ::testing::SizeIs;

constexpr const char* kPosted = preference::kFollowUpPostedHashes;
constexpr const char* kDismissed = preference::kFollowUpDismissedHashes;

FollowUpItem item(const char* identifier, std::uint64_t displayStyle = 0) {
  FollowUpItem made;
  made.uniqueIdentifier = identifier;
  made.displayStyle = displayStyle;
  return made;
}

/// Refuses what it is told to, and remembers the calls.
class RecordingProvider : public KVRFollowUpProvider {
 public:
  std::vector<FollowUpItem> pending;
  std::optional<Error> postError, clearError, listError;
  std::vector<FollowUpItem> posts;
  std::vector<std::vector<std::string>> clears;

  std::optional<Error> postFollowUpItem(const FollowUpItem& item) override {
    posts.push_back(item);
    return postError;
  }
  std::optional<Error> clearPendingFollowUpItemsWithUniqueIdentifiers(
      const std::vector<std::string>& identifiers) override {
    clears.push_back(identifiers);
    return clearError;
  }
  Result<std::vector<FollowUpItem>> pendingFollowUpItems() override {
    if (listError) return *listError;
    return pending;
  }
};

class AFollowUp : public AnOfferTest {
 protected:
  KVRFollowUp followUp{world.platform};
  const std::shared_ptr<RecordingProvider> provider = std::make_shared<RecordingProvider>();
  KVRFollowUp recorded{world.platform, provider};

  void recordDismissal(const std::string& serialNumber, Date date) {
    world.preferences.setObject(Value::Array{sha256Hash(serialNumber)}, kDismissed);
    world.preferences.setObject(date, sha256Hash(serialNumber) + ".dismissed");
  }
};

TEST_F(AFollowUp, IsPostedByTheFirstRuleThatApplies) {
  const Value off = Value::Dictionary{{"zubOfferEligibleUntil", inDays(5).secondsSince1970}};
  const auto lasting = [&](int days) {
    auto warranty = offer(10);
    warranty["featureToggleParameters"] =
        Value::Dictionary{{"zubOfferDisplay", true}, {"zubOfferDurationDaysBeforeEndDate", days}};
    return warranty;
  };
  const auto device = [](const char* activation) { return format("D (SN) (%@) - Default", activation); };
  const auto plain = device("(null)");
  const std::string posted = "Posted follow-up: serialNumber:SN -> success";
  const auto due = "Device eligible. Post new  followup for " + plain;
  const auto future = [&](const std::string& it, double days) {
    return format("Device eligible with future post date. Cannot post followup for %@ on: %@", it,
                  inDays(days));
  };
  const auto tomorrow = device(describe(inDays(1)).c_str());
  const auto dismissed = "Followup already dismissed for " + plain + ", leaving unposted";
  const auto boundary =
      format("Device not eligible for conversion. %@, followup dismissed date: %@, fup display date: %@",
             plain, inDays(-1), inDays(-1));
  const std::string activated = "Using initial postdate as it is later than FollowupDisplay Date";
  const struct {
    Value warranty;
    std::optional<Date> activation;
    std::optional<double> dismissedInDays;
    bool repost;
    std::vector<std::string> lines;
  } cases[] = {
      {{}, {}, {}, true, {"No warranty downloaded for device. Don't post a followup for " + plain}},
      {off, {}, {}, true, {"Device NOT eligible. Don't post a followup for " + plain}},
      {offer(0), {}, {}, true, {"Device no longer eligible. Don't post a followup for " + plain}},
      {shownInDays(-1, 5), {}, -1, false, {boundary, dismissed}},
      {offer(5), {}, -9, false, {dismissed}},
      {shownInDays(-1, 5), {}, -2, false, {due, posted}},
      {shownInDays(2, 5), {}, -2, false, {future(plain, 2)}},
      {shownInDays(-1, 5), {}, -0.5, true, {due, posted}},
      {shownInDays(-1, 5), inDays(1), {}, false, {activated, future(tomorrow, 1)}},
      {shownInDays(0, 5), {}, {}, false, {due, posted}},
      {lasting(14), {}, {}, false, {due, posted}},
      {lasting(7), {}, {}, false, {future(plain, 3)}},
  };
  for (const auto& test : cases) {
    for (const char* key : {kDismissed, kPosted}) world.preferences.removeObject(key);
    if (test.dismissedInDays) recordDismissal("SN", inDays(*test.dismissedInDays));
    newLines();
    const bool isPosted = test.lines.back() == posted;
    EXPECT_EQ(
        followUp._postFollowUpWithDevicesInfo({info("SN", test.warranty, test.activation)}, test.repost),
        isPosted);
    for (const auto& line : world.log.lines()) {
      const bool isDebug = line.text.starts_with("Device not eligible for conversion");
      EXPECT_EQ(line.level, isDebug ? LogLevel::Debug : LogLevel::Default) << line.text;
    }
    EXPECT_EQ(newLines(), test.lines);
    EXPECT_THAT(hashes(kPosted), SizeIs(isPosted ? 1 : 0));
  }
}

TEST_F(AFollowUp, ConvertsAgainOnceAfterADismissalWhenItsDisplayDateMoves) {
  EXPECT_TRUE(followUp.postFollowUpWithDevicesInfo({info("SN", shownInDays(-1, 30)), info("B", due(3))}));
  EXPECT_THAT(hashes(kPosted), ElementsAre(sha256Hash("SN"), sha256Hash("B")));
  followUp.dismissFollowUpForSerialNumber("SN");
  EXPECT_THAT(pendingSerials(), ElementsAre("B"));

  const auto moved = shownInDays(2, 30);
  EXPECT_FALSE(followUp.postFollowUpWithDevicesInfo({info("SN", moved)}));
  EXPECT_THAT(hashes(kPosted), ElementsAre(sha256Hash("B"))) << "at the first decision after the move";
  world.queues.advance(2 * kDay);
  EXPECT_TRUE(followUp.postFollowUpWithDevicesInfo({info("SN", moved)}));
  followUp.dismissFollowUpForSerialNumber("SN");
  EXPECT_FALSE(followUp.postFollowUpWithDevicesInfo({info("SN", moved)}));
  EXPECT_THAT(hashes(kDismissed), ElementsAre(sha256Hash("SN"), sha256Hash("SN")));
  EXPECT_EQ(world.preferences.dateForKey(sha256Hash("SN") + ".dismissed"), world.clock.now());
}

TEST_F(AFollowUp, RecordsNothingThatTheCentreRefused) {
  provider->postError = provider->clearError = Error{"centre", 5, "full"};
  EXPECT_TRUE(recorded.postFollowUpWithDevicesInfo({info("SN", due(5))})) << "it was picked";
  recorded.dismissFollowUpForSerialNumber("SN");
  const auto error = describe(*provider->postError);
  EXPECT_EQ(world.log.count("Posted follow-up: serialNumber:SN -> " + error), 1U);
  EXPECT_EQ(world.log.count("Dismissed follow-up: " + error), 1U);
  for (const char* key : {kPosted, kDismissed}) EXPECT_TRUE(world.preferences.objectForKey(key).isNull());
  EXPECT_TRUE(world.preferences.objectForKey(sha256Hash("SN") + ".dismissed").isNull());
}

TEST_F(AFollowUp, IsNotPostedWithoutWhatItNeeds) {
  const struct {
    KVRDeviceInfoRef info;
    const char* line;
  } cases[] = {
      {info({}, {}), "Failed to post follow-up:<Missing warranty><Missing serial number>"},
      {info({}, due(5)), "Failed to post follow-up:<Missing serial number>"},
      {info("SN", {}), "Failed to post follow-up:<Missing warranty>"},
      {info("SN", Value::Dictionary{}), "Failed to post follow-up:"},
  };
  for (const auto& test : cases) {
    world.log.clear();
    recorded.postFollowUpWithDeviceInfo(*test.info);
    EXPECT_THAT(world.log.texts(LogLevel::Error), ElementsAre(test.line));
  }
  EXPECT_THAT(provider->posts, IsEmpty());
}

TEST_F(AFollowUp, IsNotDismissedForWhatIsNoSerialNumber) {
  for (const auto& serialNumber : {std::string(), std::string(1000, 'x'), std::string("A\0B", 3)}) {
    world.log.clear();
    recorded.dismissFollowUpForSerialNumber(serialNumber);
    EXPECT_THAT(world.log.texts(LogLevel::Error), SizeIs(1));
  }
  EXPECT_THAT(provider->clears, IsEmpty());
  EXPECT_THAT(hashes(kDismissed), IsEmpty());
}

TEST_F(AFollowUp, RefreshesByTheFirstRuleThatApplies) {
  const Value off = Value::Dictionary{{"zubOfferEligibleUntil", inDays(5).secondsSince1970}};
  const std::string device = "D (SN) ((null)) - Default";
  const std::string cleared = "Cleared follow-up: success", updated = "Updated follow-up: success";
  const auto repost = "Device eligible for re-post. Re-post the followup for " + device;
  const auto future =
      format("Device eligible with future post date. Cannot post followup for %@ on: %@", device, inDays(1));
  const std::vector<std::string> posted = {repost, "Device eligible. Post new  followup for " + device,
                                           "Posted follow-up: serialNumber:SN -> success",
                                           "Reposted follow-up: success"};
  const struct {
    Value warranty;
    bool pending, force, shown;
    std::vector<std::string> lines;
  } cases[] = {
      {{},
       true,
       true,
       false,
       {"No warranty downloaded for device. Remove the followup for " + device, cleared}},
      {off, true, true, false, {"Device NOT eligible. Remove the followup for " + device, cleared}},
      {offer(0),
       false,
       true,
       false,
       {"Device no longer eligible. Remove the followup for " + device, cleared}},
      {due(5), true, true, true, {"Device eligible. Update the followup for " + device, updated}},
      {due(5), false, true, true, posted},
      {shownInDays(1, 5), false, true, false, {repost, future, "Reposted follow-up: NO"}},
      {due(5),
       false,
       false,
       false,
       {"Followup already dismissed/not present for " + device + ", leaving unposted"}},
  };
  for (const auto& test : cases) {
    provider->pending.clear();
    if (test.pending) {
      provider->pending = {item("own", 2)};
      provider->pending[0].userInfo = {{"FollowupSerialNumber", "SN"}};
    }
    recordDismissal("SN", inDays(-1));  // counts for nothing here
    newLines();
    EXPECT_THAT(recorded.refreshFollowupWithDeviceInfo(info("SN", test.warranty), test.force),
                SizeIs(test.shown ? 1 : 0));
    std::erase_if(provider->posts, [](const FollowUpItem& post) { return post.uniqueIdentifier != "own"; });
    EXPECT_THAT(provider->posts, SizeIs(test.pending && test.shown ? 1 : 0)) << "routing is kept";
    provider->posts.clear();
    auto lines = newLines();
    std::erase_if(lines, [](const std::string& line) { return line.starts_with("Missing"); });
    EXPECT_EQ(lines, test.lines);
  }
}

TEST_F(AFollowUp, ClearsUntrackedDevicesInOneCallWhenTheListIsWhole) {
  followUp.postFollowUpWithDevicesInfo({info("B", due(3)), info("A", due(3)), info("C", due(3))});
  followUp.refreshFollowupWithDeviceInfo(info("C", {}), false);
  EXPECT_THAT(pendingSerials(), ElementsAre("B", "A")) << "never another device's";
  provider->pending = pending();
  provider->pending.push_back(item("not the agent's"));
  newLines();
  EXPECT_THAT(recorded.refreshFollowupWithDeviceInfos({}), IsEmpty());
  EXPECT_THAT(provider->clears, ElementsAre(ElementsAre(KVRFollowUp::uniqueIdentfierForSerialNumber("A"),
                                                        KVRFollowUp::uniqueIdentfierForSerialNumber("B"))));
  EXPECT_THAT(newLines(), ElementsAre("No longer tracking device A (A) ((null)) - Default, clearing",
                                      "No longer tracking device B (B) ((null)) - Default, clearing",
                                      "Cleared follow-up: success"));
  EXPECT_THAT(hashes(kPosted), SizeIs(3)) << "clearing leaves the lists alone";
}

TEST_F(AFollowUp, TakesAListThatCannotBeReadAsEmpty) {
  provider->listError = Error{"centre", 1, "gone"};
  EXPECT_EQ(recorded.pendingFollowUpCount(), 0U);
  EXPECT_THAT(recorded.refreshFollowupWithDeviceInfos({info("SN", due(3))}), IsEmpty());
  recorded.migrateLegacyFollowUpIfNeededWithDeviceInfo(*info("SN", due(3)));
  const auto line = "Error loading pending follow-ups: " + describe(*provider->listError);
  EXPECT_THAT(world.log.texts(LogLevel::Error), ElementsAre(line, line, line));
  EXPECT_THAT(provider->posts, IsEmpty());
}

TEST_F(AFollowUp, OfAnEarlierVersionBecomesTheLocalDevicesOrGoes) {
  auto legacy = item("com.tarsil.Kavrel", 1);
  legacy.groupIdentifier = "old";
  const auto other = item("com.tarsil.Kavrel.x");
  const Error refused{"centre", 7, "no"};
  const std::string migrating = "Migrating legacy followup..";
  const std::string clearing = "Clearing legacy followup, no legacy warranty was found..";
  const std::vector<std::string> failing = {migrating,
                                            "Error posting migrated follow-up: " + describe(refused),
                                            "Error clearing legacy follow-up: " + describe(refused)};
  const struct {
    std::vector<FollowUpItem> pending;
    KVRDeviceInfoRef info;
    std::optional<Error> error;
    bool posts;
    std::vector<std::string> lines;
  } cases[] = {
      {{legacy}, info("SN", due(3)), {}, true, {migrating}},
      {{legacy}, info("SN", due(3)), refused, true, failing},
      {{legacy}, info("SN", {}), {}, false, {clearing}},
      {{legacy}, info({}, due(3)), {}, false, {clearing}},
      {{legacy, other}, info("SN", due(3)), {}, false, {}},
      {{other}, info("SN", due(3)), {}, false, {}},
  };
  for (const auto& test : cases) {
    *provider = {};
    provider->pending = test.pending;
    provider->postError = provider->clearError = test.error;
    newLines();
    recorded.migrateLegacyFollowUpIfNeededWithDeviceInfo(*test.info);
    EXPECT_EQ(newLines(), test.lines);
    ASSERT_THAT(provider->posts, SizeIs(test.posts ? 1 : 0));
    if (test.posts) {
      EXPECT_EQ(provider->posts[0].uniqueIdentifier, KVRFollowUp::uniqueIdentfierForSerialNumber("SN"));
      EXPECT_EQ(provider->posts[0].groupIdentifier, "old");
      EXPECT_EQ(provider->posts[0].displayStyle, 17U);
    }
    EXPECT_EQ(provider->clears.size(), test.lines.empty() ? 0U : 1U);
  }
  EXPECT_THAT(hashes(kPosted), IsEmpty());
}

}  // namespace
}  // namespace kvr
