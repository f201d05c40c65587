#include "platform/PropertyList.h"
#include "unit/platform/Trees.h"

namespace kvr {
namespace {

constexpr auto kXML = PropertyListEncoding::XML;
constexpr auto kBinary = PropertyListEncoding::Binary;

/// ASCII text as UTF-16 with a byte order mark.
std::string utf16(std::string_view text, bool bigEndian) {
  std::string out = bigEndian ? "\xFE\xFF" : "\xFF\xFE";
  for (const char c : text) {
    if (bigEndian) out += '\0';
    out += c;
    if (!bigEndian) out += '\0';
  }
  return out;
}

Value throughPropertyList(const Value& tree, PropertyListEncoding encoding) {
  const auto written = writePropertyList(tree, encoding);
  if (!written) return written.error().message;
  const auto read = readPropertyList(*written);
  return read ? *read : Value(read.error().message);
}

TEST(ATree, ComesBackEqualThroughEveryEncoding) {
  const auto tree = treeForEveryEncoding();
  const auto json = writeJSON(tree);
  const auto read = throughPropertyList(throughPropertyList(*readJSON(*json), kXML), kBinary);
  EXPECT_TRUE(read == tree);
  // The text also tells -0.0 from 0.0 and 1.0 from 1, which compare equal.
  EXPECT_TRUE(*writeJSON(read) == *json);
}

TEST(ATree, WithDatesDataAndSpecialRealsComesBackEqualFromPropertyLists) {
  constexpr auto kInfinity = std::numeric_limits<double>::infinity();
  const Value tree = Value::Dictionary{
      {"data", Value::Array{Value::Bytes{}, Value::Bytes{1}, Value::Bytes{1, 2}, Value::Bytes(256, 0xFF)}},
      {"dates", Value::Array{Date{-1}, Date{1764000106}, Date{-62167219201}, Date{1e15}, Date{-1e15}}},
      {"reals", Value::Array{std::numeric_limits<double>::quiet_NaN(), kInfinity, -kInfinity}},
  };
  for (const auto encoding : {kXML, kBinary}) EXPECT_EQ(throughPropertyList(tree, encoding), tree);
}

TEST(ATree, ThatXMLCannotHoldIsHeldByTheBinaryEncoding) {
  const std::pair<Value, std::string> kCases[] = {
      {Value(), "XML holds no null"},
      {std::string("\0", 1), "XML holds no such character"},
      {"\x01", "XML holds no such character"},
      {"\uFFFF", "XML holds no such character"},
      {Date{std::numeric_limits<double>::infinity()}, "XML holds no date outside the calendar"},
      {Date{-1.1e15}, "XML holds no date outside the calendar"},
  };
  for (const auto& [value, message] : kCases) {
    std::vector<Value> trees;
    trees.emplace_back(Value::Array{1, value});
    if (value.isString()) trees.emplace_back(Value::Dictionary{{value.string(), 1}});
    for (const auto& tree : trees) {
      const auto xml = writePropertyList(tree, kXML);
      ASSERT_FALSE(xml);
      EXPECT_EQ(xml.error(), (Error{"plist", 0, message}));
      EXPECT_EQ(throughPropertyList(tree, kBinary), tree);
    }
  }
}

TEST(ATree, IsWrittenUpToTheNestingThatIsRead) {
  const auto deepest = nestedArrays(kMaximumDepth);
  for (const auto encoding : {kXML, kBinary}) {
    EXPECT_EQ(throughPropertyList(deepest, encoding), deepest);
    EXPECT_FALSE(writePropertyList(nestedArrays(kMaximumDepth + 1), encoding));
  }
}

TEST(APropertyList, IsToldByItsStart) {
  const std::string document = "<plist version='1.0'><string>x</string></plist>";
  const std::string withDeclaration = "<?xml version='1.0'?>" + document;
  const std::string withType =
      "<!DOCTYPE plist PUBLIC \"-//X//DTD PLIST 1.0//EN\" \"http://localhost/PropertyList-1.0.dtd\">" +
      document;
  const std::vector<std::string> kGroups[] = {
      {document, withDeclaration, withType, "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n" + withType},
      {"<!-- comment -->" + document, "\xEF\xBB\xBF" + withDeclaration, " \t\r\n" + withDeclaration},
      {"\xEF\xBB\xBF\n" + withDeclaration, utf16(withDeclaration, true), utf16(withDeclaration, false)},
      {utf16("\n " + withDeclaration, true), utf16(document, true).substr(2),
       utf16(document, false).substr(2)},
      {"x", "'x'", "\xEF\xBB\xBF\"x\"", utf16("\"x\"", true), utf16(" x // comment", false)},
      {*writePropertyList("x", kBinary)},
  };
  for (const auto& samples : kGroups) {
    for (const auto& sample : samples) {
      const auto tree = readPropertyList(sample);
      ASSERT_TRUE(tree) << sample << ": " << tree.error().message;
      EXPECT_EQ(*tree, Value("x")) << sample;
    }
  }
}

TEST(APropertyList, IsNoneWhenItIsSomethingElse) {
  using namespace std::string_view_literals;
  const std::vector<std::string_view> kGroups[] = {
      {"", " \n", "// nothing", "\xEF\xBB", "\xFF\xFE", "\xFE\xFF\0"sv, "\0"sv},
      {"bplist", "bplist00", "<", "<?xml", "<plist", "{", "\xFF\xFE\0\xD8"sv},
      {"Not Found", "[]", R"({"a": 1})", "\x89PNG", "\x1F\x8B\b", "a b"},
      {"<html><body>404</body></html>", "<!DOCTYPE html><html/>"},
  };
  for (const auto& samples : kGroups) {
    for (const auto sample : samples) {
      const auto tree = readPropertyList(sample);
      ASSERT_FALSE(tree) << sample;
      EXPECT_EQ(tree.error().domain, "plist");
    }
  }
}

}  // namespace
}  // namespace kvr
