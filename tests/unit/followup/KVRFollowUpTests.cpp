#include "core/followup/KVRFollowUp.h"
#include "unit/OfferWorld.h"

namespace kvr {
namespace {

constexpr const char* kPosted = preference::kFollowUpPostedHashes;
constexpr const char* kDismissed = preference::kFollowUpDismissedHashes;

/// Fails as the test sets, and records the calls.
struct RecordingProvider : KVRFollowUpProvider {
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

struct AFollowUp : AnOfferTest {
  KVRFollowUp followUp{world.platform};
  const std::shared_ptr<RecordingProvider> provider = std::make_shared<RecordingProvider>();
  KVRFollowUp recorded{world.platform, provider};

  const std::string plain = "D (SN) ((null)) - Default";  ///< the device of most cases
  const Value off = Dictionary{{"zubOfferEligibleUntil", inDays(5).secondsSince1970}};

  std::string future(const std::string& device, double days) {
    return format("Device eligible with future post date. Cannot post followup for %@ on: %@", device,
                  inDays(days));
  }
  void recordDismissal(const std::string& serialNumber, Date date) {
    world.preferences.setObject(Array{sha256Hash(serialNumber)}, kDismissed);
    world.preferences.setObject(date, sha256Hash(serialNumber) + ".dismissed");
  }
};

TEST_F(AFollowUp, IsPostedByTheFirstRuleThatApplies) {
  const auto lasting = [&](int days) {
    return with({{"zubOfferDurationDaysBeforeEndDate", days}}, offer(10));
  };
  const std::string posted = "Posted follow-up: serialNumber:SN -> success";
  const auto due = "Device eligible. Post new  followup for " + plain;
  const auto tomorrow = format("D (SN) (%@) - Default", inDays(1));
  const auto dismissed = "Followup already dismissed for " + plain + ", leaving unposted";
  const auto boundary =
      format("Device not eligible for conversion. %@, followup dismissed date: %@, fup display date: %@",
             plain, inDays(-1), inDays(-1));
  const std::string activated = "Using initial postdate as it is later than FollowupDisplay Date";
  using Days = std::optional<double>;
  const std::tuple<Value, Days, Days, bool, std::vector<std::string>> cases[] = {
      {{}, {}, {}, true, {"No warranty downloaded for device. Don't post a followup for " + plain}},
      {off, {}, {}, true, {"Device NOT eligible. Don't post a followup for " + plain}},
      {offer(0), {}, {}, true, {"Device no longer eligible. Don't post a followup for " + plain}},
      {shownInDays(-1, 5), {}, -1, false, {boundary, dismissed}},
      {offer(5), {}, -9, false, {dismissed}},
      {shownInDays(-1, 5), {}, -2, false, {due, posted}},
      {shownInDays(2, 5), {}, -2, false, {future(plain, 2)}},
      {shownInDays(-1, 5), {}, -0.5, true, {due, posted}},
      {shownInDays(-1, 5), 1, {}, false, {activated, future(tomorrow, 1)}},
      {shownInDays(0, 5), {}, {}, false, {due, posted}},
      {lasting(14), {}, {}, false, {due, posted}},
      {lasting(7), {}, {}, false, {future(plain, 3)}}};
  for (const auto& [offered, activatedIn, dismissedIn, repost, lines] : cases) {
    for (const char* key : {kDismissed, kPosted}) world.preferences.removeObject(key);
    if (dismissedIn) recordDismissal("SN", inDays(*dismissedIn));
    newLines();
    const bool isPosted = lines.back() == posted;
    const auto activation = activatedIn ? std::optional(inDays(*activatedIn)) : std::nullopt;
    EXPECT_EQ(followUp._postFollowUpWithDevicesInfo({info("SN", offered, activation)}, repost), isPosted);
    for (const auto& line : world.log.lines()) {
      const bool isDebug = line.text.starts_with("Device not eligible for conversion");
      EXPECT_EQ(line.level, isDebug ? LogLevel::Debug : LogLevel::Default) << line.text;
    }
    EXPECT_EQ(newLines(), lines);
    EXPECT_THAT(hashes(kPosted), SizeIs(isPosted ? 1 : 0));
  }
}

TEST_F(AFollowUp, ConvertsAgainOnceADismissedOffersDisplayDateMoves) {
  followUp.postFollowUpWithDevicesInfo({info("SN", shownInDays(-1, 30)), info("B", due(3))});
  followUp.dismissFollowUpForSerialNumber("SN");
  EXPECT_FALSE(followUp.postFollowUpWithDevicesInfo({info("SN", shownInDays(2, 30))}));
  EXPECT_THAT(hashes(kPosted), ElementsAre(sha256Hash("B"))) << "at the first decision after the move";
  EXPECT_THAT(pendingSerials(), ElementsAre("B"));
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
  const std::pair<KVRDeviceInfoRef, const char*> cases[] = {
      {info({}, {}), "Failed to post follow-up:<Missing warranty><Missing serial number>"},
      {info({}, due(5)), "Failed to post follow-up:<Missing serial number>"},
      {info("SN", {}), "Failed to post follow-up:<Missing warranty>"},
      {info("SN", Dictionary{}), "Failed to post follow-up:"}};
  for (const auto& [device, line] : cases) {
    world.log.clear();
    recorded.postFollowUpWithDeviceInfo(*device);
    EXPECT_THAT(world.log.texts(LogLevel::Error), ElementsAre(line));
  }
  EXPECT_THAT(provider->posts, IsEmpty());
}

TEST_F(AFollowUp, RefreshesByTheFirstRuleThatApplies) {
  const std::string cleared = "Cleared follow-up: success", updated = "Updated follow-up: success";
  const auto repost = "Device eligible for re-post. Re-post the followup for " + plain;
  const std::vector<std::string> posted = {repost, "Device eligible. Post new  followup for " + plain,
                                           "Posted follow-up: serialNumber:SN -> success",
                                           "Reposted follow-up: success"};
  const auto removed = [&](const char* why) {
    return std::vector{why + std::string(". Remove the followup for ") + plain, cleared};
  };
  const auto absent = "Followup already dismissed/not present for " + plain + ", leaving unposted";
  const std::tuple<Value, bool, bool, bool, std::vector<std::string>> cases[] = {
      {{}, true, true, false, removed("No warranty downloaded for device")},
      {off, true, true, false, removed("Device NOT eligible")},
      {offer(0), false, true, false, removed("Device no longer eligible")},
      {due(5), true, true, true, {"Device eligible. Update the followup for " + plain, updated}},
      {due(5), false, true, true, posted},
      {shownInDays(1, 5), false, true, false, {repost, future(plain, 1), "Reposted follow-up: NO"}},
      {due(5), false, false, false, {absent}}};
  for (const auto& [warranty, pending, force, shown, lines] : cases) {
    provider->pending.clear();
    if (pending) provider->pending = {item("own", 2, {{"FollowupSerialNumber", "SN"}})};
    recordDismissal("SN", inDays(-1));  // must have no effect here
    newLines();
    EXPECT_THAT(recorded.refreshFollowupWithDeviceInfo(info("SN", warranty), force), SizeIs(shown ? 1 : 0));
    std::erase_if(provider->posts, [](const FollowUpItem& post) { return post.uniqueIdentifier != "own"; });
    EXPECT_THAT(provider->posts, SizeIs(pending && shown ? 1 : 0)) << "routing is kept";
    provider->posts.clear();
    auto logged = newLines();
    std::erase_if(logged, [](const std::string& line) { return line.starts_with("Missing"); });
    EXPECT_EQ(logged, lines);
  }
}

TEST_F(AFollowUp, ClearsUntrackedDevicesInOneCallWhenTheListIsWhole) {
  followUp.postFollowUpWithDevicesInfo({info("B", due(3)), info("A", due(3)), info("C", due(3))});
  followUp.refreshFollowupWithDeviceInfo(info("C", {}), false);
  EXPECT_THAT(pendingSerials(), ElementsAre("B", "A")) << "never another device's";
  provider->pending = pending();
  provider->pending.push_back(item("not the agent's", 0));
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
  const auto other = item("com.tarsil.Kavrel.x", 0);
  const Error refused{"centre", 7, "no"};
  const std::string migrating = "Migrating legacy followup..";
  const std::string clearing = "Clearing legacy followup, no legacy warranty was found..";
  const std::vector failing = {migrating, "Error posting migrated follow-up: " + describe(refused),
                               "Error clearing legacy follow-up: " + describe(refused)};
  const auto local = info("SN", due(3));
  const std::tuple<std::vector<FollowUpItem>, KVRDeviceInfoRef, bool, std::vector<std::string>> cases[] = {
      {{legacy}, local, false, {migrating}},         {{legacy}, local, true, failing},
      {{legacy}, info("SN", {}), false, {clearing}}, {{legacy}, info({}, due(3)), false, {clearing}},
      {{legacy, other}, local, false, {}},           {{other}, local, false, {}}};
  for (const auto& [shown, device, fails, lines] : cases) {
    *provider = {};
    provider->pending = shown;
    if (fails) provider->postError = provider->clearError = refused;
    newLines();
    recorded.migrateLegacyFollowUpIfNeededWithDeviceInfo(*device);
    EXPECT_EQ(newLines(), lines);
    const bool posts = !lines.empty() && lines[0] == migrating;
    ASSERT_THAT(provider->posts, SizeIs(posts ? 1 : 0));
    for (const auto& post : provider->posts) {
      EXPECT_EQ(post.uniqueIdentifier, KVRFollowUp::uniqueIdentfierForSerialNumber("SN"));
      EXPECT_EQ(post.groupIdentifier, "old");
      EXPECT_EQ(post.displayStyle, 17U);
    }
    EXPECT_EQ(provider->clears.size(), lines.empty() ? 0U : 1U);
  }
  EXPECT_THAT(hashes(kPosted), IsEmpty());
}

}  // namespace
}  // namespace kvr
