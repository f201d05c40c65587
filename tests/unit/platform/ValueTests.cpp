#include "Prelude.h"
#include "platform/value/Value.h"

namespace kvr {
namespace {

constexpr auto kLowest = std::numeric_limits<std::int64_t>::min();
constexpr auto kHighest = std::numeric_limits<std::int64_t>::max();
constexpr auto kLargest = std::numeric_limits<double>::max();

TEST(AValue, EqualsWhatHasTheSameContent) {
  const std::tuple<Value, Value, bool> kCases[] = {
      {1, 1.0, true},
      {std::nan(""), std::nan(""), true},
      {Date{std::nan("")}, Date{std::nan("")}, true},
      {std::uint64_t{1} << 63U, 9223372036854775808.0, true},
      {kHighest, 9223372036854775808.0, false},
      {std::numeric_limits<std::uint64_t>::max(), 18446744073709551616.0, false},
      {(1LL << 53U) + 1, 9007199254740992.0, false},
      {1, true, false},
      {Array{1, "a"}, Array{1.0, "a"}, true},
      {Dictionary{{"a", Value::Bytes{1}}}, Dictionary{{"a", Value::Bytes{1}}}, true},
      {Dictionary{{"a", 1}}, Dictionary{{"b", 1}}, false}};
  for (const auto& [left, right, equal] : kCases) {
    EXPECT_EQ(left == right, equal) << describe(left) << " and " << describe(right);
    EXPECT_EQ(right == left, equal) << describe(right) << " and " << describe(left);
    EXPECT_EQ(left, left);
  }
}

TEST(AValue, IsReadAsAnyOtherKind) {
  const std::tuple<Value, bool, double, std::int64_t> kCases[] = {
      {{}, false, 0, 0},
      {std::uint64_t{1} << 63U, true, 9223372036854775808.0, kHighest},
      {-2.9, true, -2.9, -2},
      {1e300, true, 1e300, kHighest},
      {Array{1}, false, 0, 0},
      {"", false, 0, 0},
      {" \t+12.5 days", true, 12.5, 12},
      {"+-7", true, 0, 0},
      {"-+007", true, 0, 0},
      {".5", false, 0.5, 0},
      {"yes", true, 0, 0},
      {"0x10", false, 0, 0},
      {"1e3", true, 1000, 1},
      {"1e999", true, kLargest, 1},
      {"-1e999", true, -kLargest, -1},
      {"-1" + std::string(400, '0'), true, -kLargest, kLowest},
      {"0." + std::string(400, '0') + "1e401", false, 1, 0}};
  for (const auto& [value, asBool, asDouble, asInteger] : kCases) {
    EXPECT_EQ(value.asBool(), asBool) << describe(value);
    EXPECT_EQ(value.asDouble(), asDouble) << describe(value);
    EXPECT_EQ(value.asInteger(), asInteger) << describe(value);
  }
}

TEST(AValue, IsDescribedOnOneLine) {
  const std::pair<Value, std::string_view> kCases[] = {
      {{}, "(null)"},
      {"plain \"text\"", "plain \"text\""},
      {Date{1764000106.9}, "2025-11-24 16:01:46 +0000"},
      {Dictionary{{"covered", true}, {"items", Array{"a", "b \"c\"", Value(), -1, 0.5}}},
       R"({covered = 1; items = (a, "b \"c\"", <null>, -1, 0.5); })"},
      {Array{Value::Bytes{0x0F, 0xBD}, "", Date{0}}, R"((<0fbd>, "", "1970-01-01 00:00:00 +0000"))"}};
  for (const auto& [value, text] : kCases) EXPECT_EQ(describe(value), text);
}

TEST(ADate, IsReadFromTheCalendarInEveryEra) {
  const std::pair<double, std::string_view> kCases[] = {
      {0, "1970-01-01 00:00:00 +0000"},         {-0.5, "1969-12-31 23:59:59 +0000"},
      {951782400, "2000-02-29 00:00:00 +0000"}, {-62167219201, "-0001-12-31 23:59:59 +0000"},
      {1.1e15, "1.1e+15 s since 1970"},         {kInfinity, "inf s since 1970"}};
  for (const auto& [seconds, text] : kCases) EXPECT_EQ(describe(Date{seconds}), text);
  for (long long time = -1'000'000'000'000'000; time <= 1'000'000'000'000'000; time += 12'345'678'901'234) {
    EXPECT_EQ(secondsSince1970(calendarTime(time)), time);
  }
}

}  // namespace
}  // namespace kvr
