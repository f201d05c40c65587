#include "core/followup/KVRFollowUp.h"
#include "unit/OfferWorld.h"

namespace kvr {
namespace {

struct AnItem : AnOfferTest {
  static Dictionary badged(Dictionary offer, int durationInDays) {
    offer["zubOfferBadgeBeforeEndDate"] = durationInDays;
    return with({{"zubOfferSettingsRowBadge", true}}, std::move(offer));
  }
};

TEST_F(AnItem, IsIdentifiedByTheHashOfItsSerialNumber) {
  EXPECT_EQ(KVRFollowUp::uniqueIdentfierForSerialNumber("SN0000000001"),
            "com.tarsil.Kavrel.50298c06e1f4205d8248e785cfbeba899b430877b206512d6072bee97d337187");
  EXPECT_EQ(KVRFollowUp::uniqueIdentfierForSerialNumber(std::nullopt), "com.tarsil.Kavrel");
}

TEST_F(AnItem, HasEveryFieldOfItsDevice) {
  for (const auto& [type, target] : std::map<std::uint64_t, std::optional<std::string>>{
           {KVRDevice::kLocal, kFollowUpSettingsBundleIdentifier},
           {KVRDevice::kWatch, "com.tarsil.Wristlink"},
           {KVRDevice::kOther, std::nullopt}}) {
    KVRFollowUp(world.platform).postFollowUpWithDeviceInfo(*info("SN", offer(3), {}, type));
    FollowUpItem expected;
    expected.uniqueIdentifier = "com.tarsil.Kavrel." + sha256Hash("SN");
    expected.groupIdentifier = "com.tarsil.followup.group.kvr";
    expected.targetBundleIdentifier = target;
    expected.extensionIdentifier = "com.tarsil.Kavrel.Extension";
    expected.displayStyle = 18;
    expected.title = "Zub";
    expected.informativeFooterText = "3 days left";
    expected.expirationDate = inDays(3) - 0.001;
    expected.userInfo = {{"FollowupSerialNumber", "SN"},
                         {kFollowUpRelativeDateCeilingKey, true},
                         {kFollowUpRelativeDateSingleDayKey, "One day left"},
                         {kFollowUpRelativeDatePluralDaysFormatKey, "%@ days left"}};
    expected.actions = {{"Add", std::nullopt}};
    EXPECT_THAT(pending(), ElementsAre(expected));
  }
}

TEST_F(AnItem, CarriesABadgeNearTheEndAndNeverLosesABit) {
  const auto unwanted = offer(3, {{"zubOfferBadgeBeforeEndDate", 5}});
  const std::tuple<Value, std::uint64_t, bool, std::uint64_t> cases[] = {
      {badged(offer(3), 5), 2, true, 3},   {badged(offer(3), 2), 2, false, 18},
      {badged(offer(3), 3), 2, false, 18}, {badged(offer(3), 0), 2, false, 18},
      {badged(offer(0), 5), 2, false, 18}, {unwanted, 2, false, 18},
      {badged(offer(3), 2), 3, false, 19}, {badged({}, 5), 2, false, 18},
      {badged(offer(3), 5), 18, true, 19}};
  for (const auto& [warranty, before, shows, after] : cases) {
    FollowUpItem item;
    item.displayStyle = before;
    world.log.clear();
    KVRFollowUp(world.platform)._setupFollowUpItem(item, *info("SN", warranty));
    EXPECT_EQ(item.displayStyle, after) << describe(warranty);
    const auto line =
        format("-[KVRFollowUp _setupFollowUpItem:withDeviceInfo:]: shouldShowRowBadge: %d", shows);
    EXPECT_EQ(world.log.count(line), 1U);
  }
}

TEST_F(AnItem, LeavesOutTextsThatAreMissingAndKeepsItsRouting) {
  const auto rest = info("SN", Dictionary{{"zubLocalizedOfferPluralDescFormat", Value()}});
  FollowUpItem item;
  item.uniqueIdentifier = item.groupIdentifier = item.targetBundleIdentifier = "own";
  item.userInfo = {{"earlier", 1}};
  item.actions = {{"a", "url"}, {"b", "url"}};
  FollowUpItem expected = item;
  expected.displayStyle = 16;
  expected.userInfo = {{"FollowupSerialNumber", "SN"}, {kFollowUpRelativeDateCeilingKey, true}};
  expected.actions = {{Value(), std::nullopt}};
  KVRFollowUp(world.platform)._setupFollowUpItem(item, *rest);
  EXPECT_EQ(item, expected);
  EXPECT_EQ(world.log.count("Missing zubLocalizedOfferSingularDesc value"), 1U);
  EXPECT_EQ(world.log.count("Missing zubLocalizedOfferPluralDescFormat value"), 1U);

  world.log.clear();
  expected.title = 7;
  expected.informativeFooterText = 1.5;
  expected.userInfo.insert(
      {{kFollowUpRelativeDateSingleDayKey, 1.5}, {kFollowUpRelativeDatePluralDaysFormatKey, Array{}}});
  expected.actions = {{false, std::nullopt}};
  KVRFollowUp(world.platform)
      ._setupFollowUpItem(item, *info("SN", Dictionary{{"zubLocalizedOfferLabel", 7},
                                                       {"zubLocalizedOfferCTA", false},
                                                       {"zubLocalizedOfferSingularDesc", 1.5},
                                                       {"zubLocalizedOfferPluralDescFormat", Array{}}}));
  EXPECT_EQ(item, expected) << "what is no string is kept as the service sent it";
  EXPECT_THAT(world.log.texts(LogLevel::Error), IsEmpty());

  world.log.clear();
  auto noSingular = offer(3);
  noSingular.erase("zubLocalizedOfferSingularDesc");
  KVRFollowUp(world.platform)._setupFollowUpItem(item, *info("SN", noSingular));
  EXPECT_THAT(item.userInfo, SizeIs(3));
  EXPECT_THAT(world.log.texts(LogLevel::Error), ElementsAre("Missing zubLocalizedOfferSingularDesc value"));
}

}  // namespace
}  // namespace kvr
