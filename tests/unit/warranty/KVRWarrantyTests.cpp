#include "core/warranty/KVRWarranty.h"
#include "core/warranty/WarrantyKeys.h"
#include "unit/SimulatedTest.h"

namespace kvr {
namespace {

struct AWarranty : SimulatedTest {
  AWarranty() { world.clock.set(Date{1'800'000'000}); }

  std::shared_ptr<KVRWarranty> from(const Value& dictionary) {
    return KVRWarranty::initWithDictionary(world.platform, dictionary);
  }
  /// A warranty whose eligibility ends in so many seconds, with both forms of both offer texts.
  std::shared_ptr<KVRWarranty> eligibleFor(double seconds) {
    return from(Dictionary{
        {"zubOfferEligibleUntil", static_cast<std::int64_t>((world.clock.now() + seconds).secondsSince1970)},
        {"zubLocalizedOfferPluralDescFormat", "%@ days left"},
        {"zubLocalizedOfferSingularDesc", "last day"},
        {"zubLocalizedOfferDetailsPluralEligibilityFormat", "within %@ days"},
        {"zubLocalizedOfferDetailsSingularEligibility", "today"}});
  }
};

TEST_F(AWarranty, IsNullOnlyWithoutADictionary) {
  EXPECT_EQ(from({}), nullptr);
  EXPECT_EQ(from(Array{}), nullptr);
  EXPECT_EQ(KVRWarranty::warrantyWithDictionary(world.platform, {}), nullptr);
  EXPECT_EQ(world.log.texts().back(), "+[KVRWarranty warrantyWithDictionary:serialNumber:] : 0");

  const auto empty = KVRWarranty::warrantyWithDictionary(world.platform, Dictionary{});
  ASSERT_NE(empty, nullptr);
  EXPECT_EQ(world.log.texts().back(), "+[KVRWarranty warrantyWithDictionary:serialNumber:] : 1");
  EXPECT_FALSE(empty->covered());
}

TEST_F(AWarranty, ReadsNumbersAsDatesByTheEpochRule) {
  const std::pair<Value, std::optional<double>> cases[] = {
      {1'700'000'000, 1'700'000'000},
      {1'700'000'000'000, 1'700'000'000},
      {10'000'000'000, 10'000'000'000},  // still seconds
      {10'000'000'001, 10'000'000},      // milliseconds, remainder dropped
      {0, 0},
      {-1, 18'446'744'073'709'551.0},  // wraps, and then counts as milliseconds
      {-1.9, 18'446'744'073'709'551.0},
      {-0.9, 0},
      {std::numeric_limits<std::int64_t>::min(), 9'223'372'036'854'775.0},
      {-1e300, 9'223'372'036'854'775.0},
      {10'000'000'000.9, 10'000'000'000},
      {true, 1},
      {18'446'744'073'709'551'615ULL, 18'446'744'073'709'551.0},
      {1e300, 18'446'744'073'709'551.0},
      {std::numeric_limits<double>::quiet_NaN(), 0},
      {"1700000000", std::nullopt},
      {Date{5}, std::nullopt}};
  for (const auto& [number, seconds] : cases) {
    const auto date = from(Dictionary{{"coverageEndDate", number}})->coverageEndDate();
    EXPECT_EQ(date ? std::optional(date->secondsSince1970) : std::nullopt, seconds) << describe(number);
  }
}

TEST_F(AWarranty, FindsEachKeyAtItsPlaceOnly) {
  const auto warranty = from(Dictionary{
      {"featureToggleParameters", Dictionary{{"zubOfferDisplay", true},
                                             {"zubOfferBadgeBeforeEndDate", 5},
                                             {"zubOfferDurationDaysBeforeEndDate", "1.5"},
                                             {"zubOfferToggle", Array{"00101"}}}},
      {"zubOfferDisplay", false},
      {"coverage", Dictionary{{"localizedCoverageTitle", 7},
                              {"benefitsCard", Dictionary{{"localizedBenefitsCardTitle", "Card"}}}}}});
  EXPECT_TRUE(warranty->zubOfferDisplay());
  EXPECT_EQ(warranty->zubOfferBadgeDurationBeforeEndDate(), 0);
  EXPECT_EQ(warranty->zubOfferDurationBeforeEndDate(), 1.5 * 86400);
  EXPECT_EQ(warranty->zubOfferToggle(), Value(Array{"00101"}));
  EXPECT_EQ(warranty->localizedCoverageDetailsTitle(), Value(7)) << "other kinds pass through";
  EXPECT_EQ(warranty->localizedBenefitsCardTitle(), Value("Card"));

  const auto broken = from(Dictionary{{"coverage", "text"}, {"featureToggleParameters", Array{}}});
  EXPECT_EQ(broken->coverageDetailsDictionary(), Value("text"));
  EXPECT_EQ(broken->localizedBenefitsCardTitle(), Value());
  EXPECT_FALSE(broken->zubOfferDisplay());
}

TEST_F(AWarranty, TakesItsConversionDateFromTheFirstSourceThatHasOne) {
  const Value end = 1'700'000'000;
  const std::tuple<Value, Dictionary, std::optional<Date>> cases[] = {
      {1'600'000'000, {{"zubOfferConversionDate", 1'650'000'000}}, Date{1'600'000'000}},
      {"1600000000", {{"zubOfferConversionDate", 1'650'000'000}}, Date{1'650'000'000}},
      {{}, {{"zubOfferConversionDate", 0}, {"coverageEndDate", end}}, std::nullopt},
      {{}, {{"zubOfferConversionDate", Value()}, {"coverageEndDate", end}}, std::nullopt},
      {{}, {{"zubOfferConversionDate", "12"}, {"coverageEndDate", end}}, std::nullopt},
      {{}, {{"coverageEndDate", end}}, Date{1'700'000'000 + 3600}},
      {{}, {}, std::nullopt}};
  world.preferences.setObject(3600, preference::kOneDayInterval);
  for (const auto& [override, dictionary, date] : cases) {
    world.preferences.setObject(override, preference::kConversionDate);
    EXPECT_EQ(from(dictionary)->zubOfferConversionDate(), date) << describe(Value(dictionary));
  }
}

TEST_F(AWarranty, CountsTheDaysLeftAndChoosesTheOfferTextByThem) {
  const std::tuple<double, Value, std::uint32_t, const char*, const char*> cases[] = {
      {2 * kDay + 1, {}, 3, "3 days left", "within 3 days"},
      {1.5 * kDay, {}, 2, "2 days left", "within 2 days"},
      {1, {}, 1, "last day", "today"},
      {-1, {}, 0, "last day", "today"},
      {7200, 3600, 2, "2 days left", "within 2 days"},
      {2 * kDay, -3, 2, "2 days left", "within 2 days"},  // no day length: 86400
      {1234 * kDay, {}, 1234, "1,234 days left", "within 1,234 days"},
      {1e9, 1e-9, 4294967295, "4,294,967,295 days left", "within 4,294,967,295 days"}};
  for (const auto& [secondsLeft, dayLength, days, offer, eligibility] : cases) {
    world.preferences.setObject(dayLength, preference::kOneDayInterval);
    const auto warranty = eligibleFor(secondsLeft);
    EXPECT_EQ(warranty->daysEligible(), days) << secondsLeft;
    EXPECT_EQ(warranty->zubLocalizedOfferDesc(), Value(offer)) << secondsLeft;
    EXPECT_EQ(warranty->zubLocalizedOfferDetailsEligibility(), Value(eligibility)) << secondsLeft;
  }
  EXPECT_EQ(from(Dictionary{})->daysEligible(), 0U);
  world.preferences.removeObject(preference::kOneDayInterval);
  EXPECT_EQ(from(Dictionary{{"zubOfferEligibleUntil", -1}})->daysEligible(), 4294967295U);
}

TEST_F(AWarranty, FillsOnlyItsOwnPlaceholderInTextsFromTheService) {
  const std::pair<Value, Value> cases[] = {
      {"%1$@ jours", "3 jours"},
      {"100%% for %@", "100% for 3"},
      {"%@ of %@", "3 of %@"},
      {"%s%n%d %", "%s%n%d %"},
      {7, Value()},
  };
  auto warranty = eligibleFor(3 * 86400.0);
  for (const auto& [format, text] : cases) {
    warranty->zubLocalizedOfferPluralDescFormat = format;
    EXPECT_EQ(warranty->zubLocalizedOfferDesc(), text);
  }
  warranty->zubLocalizedOfferDetailsPluralEligibilityFormat = Value();
  EXPECT_EQ(warranty->zubLocalizedOfferDetailsEligibility(), Value());
  EXPECT_THAT(world.log.texts(LogLevel::Error),
              ElementsAre("zubLocalizedOfferDesc: zubLocalizedOfferPluralDescFormat is not a string",
                          "zubLocalizedOfferDetailsEligibility: "
                          "zubLocalizedOfferDetailsPluralEligibilityFormat is not a string"));
}

TEST_F(AWarranty, IsItsDictionaryForEqualityAndCoding) {
  const Value dictionary = Dictionary{{"covered", true}, {"unknown", Array{1, 2.5, "x", Value()}}};
  const auto warranty = from(dictionary);
  warranty->covered = false;
  EXPECT_TRUE(warranty->isEqual(*from(dictionary)));
  EXPECT_FALSE(warranty->isEqual(*from(Dictionary{{"covered", true}})));

  const auto decoded = KVRWarranty::initWithCoder(world.platform, warranty->encodeWithCoder());
  EXPECT_TRUE(decoded->isEqual(*warranty));
  EXPECT_TRUE(decoded->covered()) << "properties are read from the dictionary again";

  const Value data = Dictionary{{"x", Value::Bytes{1}}};
  EXPECT_FALSE(KVRWarranty::initWithCoder(world.platform, Dictionary{{"DictionaryRepresentation", data}}));
}

}  // namespace
}  // namespace kvr
