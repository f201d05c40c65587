#include "platform/PropertyList.h"
#include "unit/platform/Trees.h"

namespace kvr {
namespace {

TEST(AnASCIIPropertyList, IsReadAsStringsAndData) {
  const TreesByText cases = {
      {"{ a = 1; 'b c' = (x, \"y z\", ); d = { }; }",
       Value::Dictionary{{"a", "1"}, {"b c", Value::Array{"x", "y z"}}, {"d", Value::Dictionary{}}}},
      {"{a=1;a=2;}", Value::Dictionary{{"a", "2"}}},
      {"(<0fbd77 1c2735AE>, <>)",
       Value::Array{Value::Bytes{0x0f, 0xbd, 0x77, 0x1c, 0x27, 0x35, 0xae}, Value::Bytes{}}},
      {"/path/to_it.x-$1:2", "/path/to_it.x-$1:2"},
      {R"("\n\t\"\\\'\101\012\Ud83d\UDE00\U00e9\351\/")", "\n\t\"\\'A\n\U0001F600\u00e9\u00d8/"},
      {"/* a */ { // b\n k /* = */ = v; } // c", Value::Dictionary{{"k", "v"}}},
      {"\"KEY\" = \"text\";\n/* c */ OTHER = { a = (b); };\n",
       Value::Dictionary{{"KEY", "text"}, {"OTHER", Value::Dictionary{{"a", Value::Array{"b"}}}}}},
  };
  expectTrees(readPropertyList, cases);
}

TEST(AnASCIIPropertyList, IsRefusedWithThePlaceOfItsFault) {
  const FaultsByText cases = {
      {"two words", "byte 4: more text after the end of the value"},
      {"{ a = 1 }", "byte 8: no ';' after a dictionary's value"},
      {"{ a 1; }", "byte 4: no '=' after a key"},
      {"{ a = 1;", "byte 8: the text ends too early"},
      {"(a b)", "byte 3: no ',' or ')' after an array's element"},
      {"<0f0>", "byte 5: half a byte of data"},
      {"<0g>", "byte 2: unexpected character in data"},
      {R"("\q")", "byte 3: unknown escape"},
      {R"("\U00g0")", "byte 5: \\U without four digits"},
      {R"("\Ud83d\U0041")", "byte 13: half a character"},
      {R"("\Ude00")", "byte 7: half a character"},
      {"\"\xC3\"", "neither a binary nor an XML property list, and not text"},
  };
  expectFaults(readPropertyList, "plist", cases);
}

TEST(AnASCIIPropertyList, ThatIsHostileDoesNoHarm) {
  for (const auto* start : {"(", "{k=", "a=(", "/*", "\"\\"}) {
    EXPECT_FALSE(readPropertyList(repeated(start, 100'000)));
  }
  EXPECT_TRUE(readPropertyList(repeated("(", kMaximumDepth) + repeated(")", kMaximumDepth)));
  EXPECT_FALSE(readPropertyList(repeated("(", kMaximumDepth + 1) + repeated(")", kMaximumDepth + 1)));
  expectDamageIsHarmless("{ a = (1, \"\\U00e9\\101 \u00e9\", <0aFf 01>); /* c */ 'b' = { c = d; }; }",
                         readPropertyList);
}

}  // namespace
}  // namespace kvr
