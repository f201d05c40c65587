#include "Trees.h"
#include "platform/codec/JSON.h"

namespace kvr {
namespace {

std::string written(const Value& tree) {
  const auto text = writeJSON(tree);
  return text ? *text : "refused: " + text.error().message;
}

TEST(AJSONText, IsReadExactly) {
  const TreesByText cases = {
      {"-9223372036854775808", std::numeric_limits<std::int64_t>::min()},
      {"18446744073709551616", 18446744073709551616.0},
      {"-9223372036854775809", -9223372036854775808.0},
      {"1e2", 100.0},
      {"1e-400", 0.0},
      {R"("\u00e9\ud83d\ude00\u0000\/")", std::string("\u00e9\U0001F600\0/", 8)},
      {"\xEF\xBB\xBF[]", Array{}},
      {R"({"b": 1, "a": [true, {}], "b": 2})", Dictionary{{"a", Array{true, Dictionary{}}}, {"b", 2}}}};
  expectTrees(readJSON, cases);
}

TEST(AJSONText, IsRefusedWithThePlaceOfItsFault) {
  using namespace std::string_literals;
  const FaultsByText cases = {
      {"", "syntax error at byte 1"},
      {"[1] x", "syntax error at byte 5"},
      {"[1]\0"s, "NUL at byte 3"},
      {"\"\0\""s, "NUL at byte 1"},
      {"[\"\xC0\xAF\"]", "syntax error at byte 3"},
      {R"(["\ud800"])", "syntax error at byte 9"},
      {"[1e999]", "number too large at byte 6"},
  };
  expectFaults(readJSON, "json", cases);
}

TEST(ATree, IsWrittenAsCompactJSON) {
  const std::pair<Value, std::string_view> kCases[] = {
      {Dictionary{{"b", Array{Value(), true, false}}, {"a", Dictionary{}}},
       R"({"a":{},"b":[null,true,false]})"},
      {Array{Array{}, -5, std::numeric_limits<std::uint64_t>::max()}, "[[],-5,18446744073709551615]"},
      {Array{1.0, -0.0, 0.1, 1e300}, "[1.0,-0.0,0.1,1e+300]"},
      {std::string("\0\x1f\x7f\b\f\n\r\t\"\\/", 11), "\"\\u0000\\u001f\x7f\\b\\f\\n\\r\\t\\\"\\\\/\""}};
  for (const auto& [tree, text] : kCases) EXPECT_EQ(written(tree), text);
  EXPECT_EQ(*writeJSON(Dictionary{{"a/b", "//"}}, JSONSlashes::Escaped), R"({"a\/b":"\/\/"})");
}

TEST(ATree, IsNotWrittenAsJSONWhenItDoesNotFit) {
  const std::pair<Value, std::string> kCases[] = {
      {Date{0}, "JSON holds no date"},
      {Value::Bytes{1}, "JSON holds no data"},
      {Array{kInfinity}, "JSON holds no number that is not finite"},
      {"\xED\xA0\x80", "text that is not UTF-8"},
      {Dictionary{{"\xC0\x80", 1}}, "text that is not UTF-8"},
      {nestedArrays(kMaximumDepth + 1), "nested too deep"}};
  for (const auto& [tree, message] : kCases) EXPECT_EQ(written(tree), "refused: " + message);
  EXPECT_TRUE(writeJSON(nestedArrays(kMaximumDepth)));
}

}  // namespace
}  // namespace kvr
