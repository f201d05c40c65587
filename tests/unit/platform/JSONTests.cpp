#include "platform/JSON.h"
#include "unit/platform/Trees.h"

namespace kvr {
namespace {

constexpr auto kInfinity = std::numeric_limits<double>::infinity();

std::string written(const Value& tree) {
  const auto text = writeJSON(tree);
  return text ? *text : "refused: " + text.error().message;
}

TEST(AJSONText, IsReadExactly) {
  const struct {
    std::string_view text;
    Value tree;
    Value::Kind kind;
  } kCases[] = {
      {" null ", {}, Value::Kind::Null},
      {"-9223372036854775808", std::numeric_limits<std::int64_t>::min(), Value::Kind::Int},
      {"9223372036854775808", std::uint64_t{1} << 63U, Value::Kind::UInt},
      {"18446744073709551616", 18446744073709551616.0, Value::Kind::Real},
      {"-9223372036854775809", -9223372036854775808.0, Value::Kind::Real},
      {"1.0", 1.0, Value::Kind::Real},
      {"1e2", 100.0, Value::Kind::Real},
      {"1e-400", 0.0, Value::Kind::Real},
      {R"("\u00e9\ud83d\ude00\u0000\/")", std::string("\u00e9\U0001F600\0/", 8), Value::Kind::String},
      {"\xEF\xBB\xBF[]", Value::Array{}, Value::Kind::Array},
      {R"({"b": 1, "a": [true, {}], "b": 2})",
       Value::Dictionary{{"a", Value::Array{true, Value::Dictionary{}}}, {"b", 2}}, Value::Kind::Dictionary},
  };
  for (const auto& [text, tree, kind] : kCases) {
    const auto read = readJSON(text);
    ASSERT_TRUE(read) << text << ": " << read.error().message;
    EXPECT_EQ(*read, tree) << text;
    EXPECT_EQ(read->kind(), kind) << text;
  }
}

TEST(AJSONText, IsRefusedWithThePlaceOfItsFault) {
  using namespace std::string_view_literals;
  const struct {
    std::string_view text;
    std::string_view message;
  } kCases[] = {
      {"", "syntax error at byte 1"},
      {"[1,]", "syntax error at byte 4"},
      {"[1] x", "syntax error at byte 5"},
      {"[1]\0"sv, "NUL at byte 3"},
      {"\"\0\""sv, "NUL at byte 1"},
      {"[\"\xC0\xAF\"]", "syntax error at byte 3"},
      {R"(["\ud800"])", "syntax error at byte 9"},
      {"[1e999]", "number too large at byte 6"},
      {"[nan]", "syntax error at byte 3"},
      {"{\"a\" 1}", "syntax error at byte 6"},
      {"// comment\n1", "syntax error at byte 1"},
  };
  for (const auto& [text, message] : kCases) {
    const auto read = readJSON(text);
    ASSERT_FALSE(read) << text;
    EXPECT_EQ(read.error(), (Error{"json", 0, std::string(message)})) << text;
  }
}

TEST(AJSONText, MayBeNestedToTheLimitAndNoFurther) {
  for (const auto& containers : {std::pair{"[", "]"}, std::pair{"{\"k\":", "}"}}) {
    const auto nested = [&containers](std::size_t depth) {
      return readJSON(repeated(containers.first, depth) + "0" + repeated(containers.second, depth));
    };
    EXPECT_TRUE(nested(kMaximumDepth));
    EXPECT_FALSE(nested(kMaximumDepth + 1));
    EXPECT_FALSE(readJSON(repeated(containers.first, 100'000)));
  }
}

TEST(AJSONText, ThatIsDamagedDoesNoHarm) {
  expectDamageIsHarmless(
      R"({"a": [1, -2.5e-3, 18446744073709551615, "\u00e9\n\ud83d\ude00é😀"], "b": {"": null}})", readJSON);
}

TEST(ATree, IsWrittenAsCompactJSON) {
  const struct {
    Value tree;
    std::string_view text;
  } kCases[] = {
      {Value::Dictionary{{"b", Value::Array{Value(), true, false}}, {"a", Value::Dictionary{}}},
       R"({"a":{},"b":[null,true,false]})"},
      {Value::Array{Value::Array{}, -5, std::numeric_limits<std::uint64_t>::max()},
       "[[],-5,18446744073709551615]"},
      {Value::Array{1.0, -0.0, 0.1, 1e300}, "[1.0,-0.0,0.1,1e+300]"},
      {std::string("\0\x1f\x7f\b\f\n\r\t\"\\/", 11), "\"\\u0000\\u001f\x7f\\b\\f\\n\\r\\t\\\"\\\\/\""},
      {"\u2028\U0001F600", "\"\u2028\U0001F600\""},
  };
  for (const auto& [tree, text] : kCases) EXPECT_EQ(written(tree), text);
  EXPECT_EQ(*writeJSON(Value::Dictionary{{"a/b", "//"}}, JSONSlashes::Escaped), R"({"a\/b":"\/\/"})");
}

TEST(ATree, IsNotWrittenAsJSONWhenItDoesNotFit) {
  const struct {
    Value tree;
    std::string_view message;
  } kCases[] = {
      {Date{0}, "JSON holds no date"},
      {Value::Bytes{1}, "JSON holds no data"},
      {Value::Array{kInfinity}, "JSON holds no number that is not finite"},
      {"\xED\xA0\x80", "text that is not UTF-8"},
      {Value::Dictionary{{"\xC0\x80", 1}}, "text that is not UTF-8"},
      {nestedArrays(kMaximumDepth + 1), "nested too deep"},
  };
  for (const auto& [tree, message] : kCases) EXPECT_EQ(written(tree), "refused: " + std::string(message));
  EXPECT_TRUE(writeJSON(nestedArrays(kMaximumDepth)));
}

}  // namespace
}  // namespace kvr
