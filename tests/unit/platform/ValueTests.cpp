#include "platform/Value.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>

namespace kvr {
namespace {

constexpr auto kLowest = std::numeric_limits<std::int64_t>::min();
constexpr auto kHighest = std::numeric_limits<std::int64_t>::max();
constexpr auto kInfinity = std::numeric_limits<double>::infinity();
constexpr auto kLargest = std::numeric_limits<double>::max();

TEST(AValue, EqualsWhatHasTheSameContent) {
  const struct {
    Value left;
    Value right;
    bool equal;
  } kCases[] = {
      {{}, {}, true},
      {1, 1.0, true},
      {-0.0, 0, true},
      {std::nan(""), std::nan(""), true},
      {Date{std::nan("")}, Date{std::nan("")}, true},
      {std::uint64_t{1} << 63U, 9223372036854775808.0, true},
      {kHighest, 9223372036854775808.0, false},
      {std::numeric_limits<std::uint64_t>::max(), 18446744073709551616.0, false},
      {kLowest, -9223372036854775808.0, true},
      {(1LL << 53U) + 1, 9007199254740992.0, false},
      {1, kInfinity, false},
      {1, true, false},
      {1, "1", false},
      {{}, false, false},
      {Value::Array{1, "a"}, Value::Array{1.0, "a"}, true},
      {Value::Array{1}, Value::Array{1, 1}, false},
      {Value::Dictionary{{"a", Value::Bytes{1}}}, Value::Dictionary{{"a", Value::Bytes{1}}}, true},
      {Value::Dictionary{{"a", 1}}, Value::Dictionary{{"b", 1}}, false},
      {Date{1}, 1, false},
  };
  for (const auto& [left, right, equal] : kCases) {
    EXPECT_EQ(left == right, equal) << describe(left) << " and " << describe(right);
    EXPECT_EQ(right == left, equal) << describe(right) << " and " << describe(left);
    EXPECT_EQ(left, left);
  }
}

TEST(AnInteger, HasOneRepresentation) {
  EXPECT_EQ(Value(static_cast<std::uint64_t>(kHighest)).kind(), Value::Kind::Int);
  EXPECT_EQ(Value(static_cast<std::uint64_t>(kHighest) + 1).kind(), Value::Kind::UInt);
}

TEST(AValue, IsReadAsAnyOtherKind) {
  const struct {
    Value value;
    bool asBool;
    double asDouble;
    std::int64_t asInteger;
  } kCases[] = {
      {{}, false, 0, 0},
      {true, true, 1, 1},
      {-3, true, -3, -3},
      {std::uint64_t{1} << 63U, true, 9223372036854775808.0, kHighest},
      {-2.9, true, -2.9, -2},
      {1e300, true, 1e300, kHighest},
      {-1e300, true, -1e300, kLowest},
      {Value::Array{1}, false, 0, 0},
      {Date{5}, false, 0, 0},
      {"", false, 0, 0},
      {" \t+12.5 days", true, 12.5, 12},
      {"-7", true, -7, -7},
      {"+-7", true, 0, 0},
      {"-+007", true, 0, 0},
      {".5", false, 0.5, 0},
      {"0000", false, 0, 0},
      {"yes", true, 0, 0},
      {"True", true, 0, 0},
      {"no", false, 0, 0},
      {"inf", false, 0, 0},
      {"nan", false, 0, 0},
      {"0x10", false, 0, 0},
      {"1e3", true, 1000, 1},
      {"1e999", true, kLargest, 1},
      {"-1e999", true, -kLargest, -1},
      {"1e-999", true, 0, 1},
      {"1" + std::string(400, '0') + "e-1", true, kLargest, kHighest},
      {"-1" + std::string(400, '0'), true, -kLargest, kLowest},
      {"0." + std::string(400, '0') + "1", false, 0, 0},
      {"0." + std::string(400, '0') + "1e401", false, 1, 0},
  };
  for (const auto& [value, asBool, asDouble, asInteger] : kCases) {
    EXPECT_EQ(value.asBool(), asBool) << describe(value);
    EXPECT_EQ(value.asDouble(), asDouble) << describe(value);
    EXPECT_EQ(value.asInteger(), asInteger) << describe(value);
  }
}

TEST(AValue, AnswersForKeysItDoesNotHave) {
  const Value dictionary = Value::Dictionary{{"a", Value::Dictionary{{"b", 1}}}, {"null", Value()}};
  EXPECT_EQ(dictionary["a"]["b"], Value(1));
  EXPECT_TRUE(dictionary["a"]["b"]["c"].isNull());
  EXPECT_TRUE(dictionary.contains("null"));
  EXPECT_FALSE(dictionary.contains("b"));
  EXPECT_EQ(Value("a").dateIfAny(), std::nullopt);
  EXPECT_EQ(Value(Date{1}).stringIfAny(), std::nullopt);
}

TEST(AValue, IsDescribedOnOneLine) {
  const struct {
    Value value;
    std::string_view text;
  } kCases[] = {
      {{}, "(null)"},
      {"plain \"text\"", "plain \"text\""},
      {Date{1764000106.9}, "2025-11-24 16:01:46 +0000"},
      {Value::Dictionary{{"covered", true}, {"items", Value::Array{"a", "b \"c\"", Value(), -1, 0.5}}},
       R"({covered = 1; items = (a, "b \"c\"", <null>, -1, 0.5); })"},
      {Value::Array{Value::Bytes{0x0F, 0xBD}, "", Date{0}}, R"((<0fbd>, "", "1970-01-01 00:00:00 +0000"))"},
  };
  for (const auto& [value, text] : kCases) EXPECT_EQ(describe(value), text);
}

TEST(ADate, IsReadFromTheCalendarInEveryEra) {
  const struct {
    double seconds;
    std::string_view text;
  } kCases[] = {
      {0, "1970-01-01 00:00:00 +0000"},
      {-0.5, "1969-12-31 23:59:59 +0000"},
      {951782399, "2000-02-28 23:59:59 +0000"},
      {951782400, "2000-02-29 00:00:00 +0000"},
      {-2203891200, "1900-03-01 00:00:00 +0000"},
      {32503680000, "3000-01-01 00:00:00 +0000"},
      {-62167219200, "0000-01-01 00:00:00 +0000"},
      {-62167219201, "-0001-12-31 23:59:59 +0000"},
      {1.1e15, "1.1e+15 s since 1970"},
      {kInfinity, "inf s since 1970"},
  };
  for (const auto& [seconds, text] : kCases) EXPECT_EQ(describe(Date{seconds}), text);
  for (long long seconds = -1'000'000'000'000'000; seconds <= 1'000'000'000'000'000;
       seconds += 12'345'678'901'234) {
    EXPECT_EQ(secondsSince1970(calendarTime(seconds)), seconds);
  }
}

}  // namespace
}  // namespace kvr
