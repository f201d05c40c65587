#include "Trees.h"
#include "platform/codec/BinaryPropertyList.h"

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
  // Comparing the text as well tells -0.0 from 0.0 and 1.0 from 1, which are equal as values.
  EXPECT_TRUE(*writeJSON(read) == *json);
}

TEST(ATree, WithDatesDataAndSpecialRealsComesBackEqualFromPropertyLists) {
  const Value tree = Dictionary{
      {"data", Array{Value::Bytes{}, Value::Bytes{1}, Value::Bytes{1, 2}, Value::Bytes(256, 0xFF)}},
      {"dates", Array{Date{-1}, Date{1764000106}, Date{-62167219201}, Date{1e15}, Date{-1e15}}},
      {"reals", Array{std::numeric_limits<double>::quiet_NaN(), kInfinity, -kInfinity}}};
  for (const auto encoding : {kXML, kBinary}) EXPECT_EQ(throughPropertyList(tree, encoding), tree);
}

TEST(ATree, ThatXMLCannotHoldIsHeldByTheBinaryEncoding) {
  const std::pair<Value, std::string> kCases[] = {
      {Value(), "XML holds no null"},
      {std::string("\0", 1), "XML holds no such character"},
      {"\uFFFF", "XML holds no such character"},
      {Date{kInfinity}, "XML holds no date outside the calendar"},
      {Date{-1.1e15}, "XML holds no date outside the calendar"},
  };
  for (const auto& [value, message] : kCases) {
    std::vector<Value> trees;
    trees.emplace_back(Array{1, value});
    if (value.isString()) trees.emplace_back(Dictionary{{value.string(), 1}});
    for (const auto& tree : trees) {
      const auto xml = writePropertyList(tree, kXML);
      ASSERT_FALSE(xml);
      EXPECT_EQ(xml.error(), (Error{"plist", 0, message}));
      EXPECT_EQ(throughPropertyList(tree, kBinary), tree);
    }
  }
}

TEST(APropertyList, IsToldByItsStart) {
  const std::string document = "<plist version='1.0'><string>x</string></plist>";
  const std::string declared = "<?xml version='1.0'?>" + document;
  const auto typed = "<!DOCTYPE plist PUBLIC \"-//X//DTD PLIST 1.0//EN\" \"http://localhost/\">" + document;
  const std::vector<std::string> kGroups[] = {
      {document, declared, typed, "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n" + typed},
      {"<!-- comment -->" + document, "\xEF\xBB\xBF" + declared, " \t\r\n" + declared},
      {"\xEF\xBB\xBF\n" + declared, utf16(declared, true), utf16("\n " + declared, false)},
      {utf16(document, true).substr(2), utf16(document, false).substr(2)},
      {"x", "'x'", "\xEF\xBB\xBF\"x\"", utf16("\"x\"", true), utf16(" x // comment", false)},
      {*writePropertyList("x", kBinary)}};
  for (const auto& samples : kGroups) {
    for (const auto& sample : samples) {
      const auto tree = readPropertyList(sample);
      EXPECT_TRUE(tree && *tree == Value("x")) << sample;
    }
  }
}

TEST(APropertyList, IsNoneWhenItIsSomethingElse) {
  using namespace std::string_view_literals;
  const std::vector<std::string_view> kGroups[] = {
      {"", " \n", "// nothing", "\xEF\xBB", "\xFF\xFE", "\xFE\xFF\0"sv, "\0"sv},
      {"bplist", "bplist00", "<", "<?xml", "<plist", "{", "\xFF\xFE\0\xD8"sv},
      {"Not Found", "[]", R"({"a": 1})", "\x89PNG", "\x1F\x8B\b", "a b"},
      {"<html><body>404</body></html>", "<!DOCTYPE html><html/>"}};
  for (const auto& samples : kGroups) {
    for (const auto sample : samples) {
      const auto tree = readPropertyList(sample);
      EXPECT_TRUE(!tree && tree.error().domain == "plist") << sample;
    }
  }
}

TEST(AnASCIIPropertyList, IsReadAsStringsAndData) {
  const TreesByText cases = {
      {"{ a = 1; 'b c' = (x, \"y z\", ); d = { }; }",
       Dictionary{{"a", "1"}, {"b c", Array{"x", "y z"}}, {"d", Dictionary{}}}},
      {"{a=1;a=2;}", Dictionary{{"a", "2"}}},
      {"(<0fbd77 1c2735AE>, <>)",
       Array{Value::Bytes{0x0f, 0xbd, 0x77, 0x1c, 0x27, 0x35, 0xae}, Value::Bytes{}}},
      {"/path/to_it.x-$1:2", "/path/to_it.x-$1:2"},
      {R"("\n\t\"\\\'\101\012\Ud83d\UDE00\U00e9\351\/")", "\n\t\"\\'A\n\U0001F600\u00e9\u00d8/"},
      {"/* a */ { // b\n k /* = */ = v; } // c", Dictionary{{"k", "v"}}},
      {"\"KEY\" = \"text\";\n/* c */ OTHER = { a = (b); };\n",
       Dictionary{{"KEY", "text"}, {"OTHER", Dictionary{{"a", Array{"b"}}}}}}};
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

std::string document(std::string_view content) {
  return "<plist version=\"1.0\">" + std::string(content) + "</plist>";
}

TEST(AnXMLElement, IsReadAsItsKind) {
  const TreesByText cases = {
      {"<integer>-0x1F</integer>", -31},
      {"<integer>0XffffFFFFffffFFFF</integer>", std::numeric_limits<std::uint64_t>::max()},
      {"<integer>-9223372036854775808</integer>", std::numeric_limits<std::int64_t>::min()},
      {"<real>-.5e1</real>", -5.0},
      {"<real>1e-400</real>", 0.0},
      {"<real>NaN</real>", std::nan("")},
      {"<real>+inf</real>", kInfinity},
      {"<false> </false>", false},
      {"<string> a&lt;&#13;&#x1F600;<![CDATA[<b>]]><!-- no --> </string>", " a<\r\U0001F600<b> "},
      {"<date>2024-02-29T23:59:59Z</date>", Date{1709251199}},
      {"<date>0000-01-01T00:00:00Z</date>", Date{-62167219200}},
      {"<date>-0001-12-31T23:59:59Z</date>", Date{-62167219201}},
      {"<date> 12345-06-07T08:09:10Z </date>", Date{327416976550}},
      {"<data>\n\tAQID\r\n BA = =\n</data>", Value::Bytes{1, 2, 3, 4}},
      {"<array><dict/><array></array></array>", Array{Dictionary{}, Array{}}},
      {"<dict><key>a</key><integer>1</integer><key/><true/><key>a</key><integer>2</integer></dict>",
       Dictionary{{"", true}, {"a", 2}}}};
  expectTrees([](std::string_view content) { return readPropertyList(document(content)); }, cases);
}

TEST(AnXMLElement, IsRefusedForATextOfAnotherKind) {
  const std::pair<std::string, std::vector<std::string>> kCases[] = {
      {"integer", {"", "abc", "1 2", "1.0", "--1", "0x", "18446744073709551616", "-9223372036854775809"}},
      {"real", {"", "0,5", "1e999", "--1", "nano", "1x"}},
      {"date", {"", "2024-01-01", "2024-01-01T00:00:00", "24-01-01T00:00:00Z", "2023-02-29T00:00:00Z"}},
      {"date", {"2024-13-01T00:00:00Z", "2024-01-01T24:00:00Z", "2024-01-01T00:00:60Z"}},
      {"date", {"99999999-01-01T00:00:00Z", "9999999999999999999-01-01T00:00:00Z"}},
      {"data", {"A", "AQI", "AQ==AQID", "A===", "AQ*=", "AR=="}},
      {"string", {"&unknown;", "&#0;", "\x01", "\xFF", "<b/>"}},
      {"array", {"text", "<key>k</key>"}},
      {"true", {"x", "<true/>"}},
      {"dict", {"<true/>", "<key>k</key>", "<key>k</key><key>l</key><true/>", "<key>k</key><true/><true/>"}},
      {"plist", {"", "text", "<true/><true/>", "<unknown/>", "<plist><true/></plist>", "<key>k</key>"}}};
  for (const auto& [name, texts] : kCases) {
    for (const auto& text : texts) {
      const auto element = "<" + name + ">" + text + "</" + name + ">";
      EXPECT_FALSE(readPropertyList(name == "plist" ? element : document(element))) << element;
    }
  }
}

TEST(AnXMLPropertyList, IsReadInItsEncodingAndRefusedForAFaultOfTheDocument) {
  const std::string latin = "<?xml version='1.0' encoding='ISO-8859-1'?>";
  EXPECT_EQ(*readPropertyList(latin + document("<string>\xE9</string>")), Value("\u00e9"));
  const std::string faulty[] = {latin + "<string>no root</string>", latin + document("<true/>") + "rest",
                                "<?xml version='1.0' encoding='unknown-8'?>" + document("<true/>"),
                                document("<array></dict>")};
  for (const auto& text : faulty) EXPECT_FALSE(readPropertyList(text)) << text;
  const auto fault = readPropertyList(document("<array>\n<integer>abc</integer>\n</array>"));
  EXPECT_EQ(fault.error(), (Error{"plist", 0, "line 2: an element whose text is not of its kind"}));
}

TEST(AnXMLPropertyList, DeclaresNoEntitiesAndFetchesNone) {
  const std::string content = document("<string>&e;</string>");
  for (const std::string type :
       {"[<!ENTITY e 'text'>]", "[<!ENTITY e SYSTEM 'file:///etc/hostname'>]",
        "[<!ENTITY a 'aaaaaaaa'><!ENTITY e '&a;&a;&a;&a;'>]",
        "[<!ENTITY % p SYSTEM 'file:///etc/hostname'> %p;]", "SYSTEM 'file:///etc/hostname'", ""}) {
    EXPECT_FALSE(readPropertyList("<?xml version='1.0'?><!DOCTYPE plist " + type + ">" + content)) << type;
  }
}

TEST(AnXMLPropertyList, IsWrittenAnElementALineWithoutDocumentType) {
  const Value tree = Dictionary{
      {"a&b", Array{1, 0.5, true, Date{-0.5}, Array{}}}, {"d", Value::Bytes{1, 2, 3, 4}}, {"t", "x\r<\n"}};
  EXPECT_EQ(
      *writePropertyList(tree, PropertyListEncoding::XML),
      "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n<dict>\n\t<key>a&amp;b</key>\n"
      "\t<array>\n\t\t<integer>1</integer>\n\t\t<real>0.5</real>\n\t\t<true/>\n"
      "\t\t<date>1969-12-31T23:59:59Z</date>\n\t\t<array/>\n\t</array>\n\t<key>d</key>\n\t<data>\n"
      "\tAQIDBA==\n\t</data>\n\t<key>t</key>\n\t<string>x&#13;&lt;\n</string>\n</dict>\n</plist>\n");
}

TEST(APropertyListWithin, GivesWhatStandsAtTheTopLevelWhateverElseItHolds) {
  constexpr std::string_view kKeys[] = {"a", "b"};
  const auto read = [&](const std::string& bytes) {
    return readPropertyListWithin({100, 1000}, bytes, kKeys);
  };
  const auto xml = [](const std::string& content) {
    return document("<dict><key>a</key><string>1</string>" + content + "</dict>");
  };
  const auto arrays = [](std::size_t count) {
    return repeated("<array>", count) + repeated("</array>", count);
  };
  const auto binary = [](const Value& tree) { return *writePropertyList(tree, kBinary); };
  const Value start = Dictionary{{"a", "1"}};
  const Value both = Dictionary{{"a", "1"}, {"b", Array{}}};
  const std::tuple<std::string, Value, bool> cases[] = {
      {"{ a = 1; }", start, true},
      {"{ a = 1; x = " + repeated("(", 9999) + repeated(")", 9999) + "; }", start, false},
      {"{ x = {a = 2;}; a = 1; b = " + repeated("{k=", 9999) + "v" + repeated(";}", 9999) + "; }",
       Dictionary{{"a", "1"}, {"b", Dictionary{}}}, false},
      {"(" + repeated("a,", 100) + ")", Array{}, false},
      {xml("<key>x</key>" + arrays(9999) + "<key>b</key><array/>"), both, false},
      {xml("<key>b</key><array>" + repeated("<true/>", 100) + "</array>"), both, false},
      {binary(Dictionary{{"a", "1"}, {"b", Array(100, 1)}}), both, false},
      {binary(Dictionary{{"a", "1"}, {std::string(1001, 'x'), 1}}), start, false},
      {binary(Array(100, 1)), Array{}, false},
      {binary(std::string(1001, 'x')), std::string(1001, 'x'), true}};
  for (const auto& [bytes, tree, isWhole] : cases) {
    const auto found = read(bytes);
    ASSERT_TRUE(found) << bytes.substr(0, 80);
    EXPECT_EQ(found->tree, tree) << bytes.substr(0, 80);
    EXPECT_EQ(found->isWhole, isWhole) << bytes.substr(0, 80);
  }
  auto leaf = binary(Dictionary{{"a", "1"}, {"b", Array{7}}});
  leaf.replace(leaf.find("\x10\x07"), 1, "\x0F");
  const auto keys = repeated("<dict><key>k</key>", 600);
  const std::string damaged[] = {leaf, "{ a = 1; x = " + repeated("(", 9999),
                                 xml("<key>x</key>" + arrays(9999) + "<key>y</key>"),
                                 xml("<key>x</key>" + keys + repeated("</dict>", 600)),
                                 xml("<key>x</key>" + keys + "<true/><true/>" + repeated("</dict>", 600))};
  for (const auto& bytes : damaged) EXPECT_FALSE(read(bytes)) << bytes.substr(0, 80);
}

TEST(ATreesText, MayBeNestedToTheLimitAndNoFurther) {
  const std::tuple<TreeReader, std::string, std::string, std::string, std::string, std::string> cases[] = {
      {readJSON, "", "[", "0", "]", ""},
      {readJSON, "", "{\"k\":", "0", "}", ""},
      {readPropertyList, "", "(", "", ")", ""},
      {readPropertyList, "", "{k=", "v", ";}", ""},
      {readPropertyList, "<plist>", "<array>", "", "</array>", "</plist>"}};
  for (const auto& [read, start, open, innermost, close, end] : cases) {
    for (const auto depth : {kMaximumDepth, kMaximumDepth + 1}) {
      const auto text = start + repeated(open, depth) + innermost + repeated(close, depth) + end;
      EXPECT_EQ(static_cast<bool>(read(text)), depth == kMaximumDepth) << open;
    }
    EXPECT_FALSE(read(start + repeated(open, 100'000))) << open;
  }
  for (const auto* start : {"a=(", "/*", "\"\\", "<dict><key>k</key>", "<unknown>"}) {
    EXPECT_FALSE(readPropertyList((*start == '<' ? "<plist>" : "") + repeated(start, 100'000))) << start;
  }
  for (const auto encoding : {kXML, kBinary}) {
    const auto deepest = nestedArrays(kMaximumDepth);
    EXPECT_EQ(throughPropertyList(deepest, encoding), deepest);
    EXPECT_FALSE(writePropertyList(nestedArrays(kMaximumDepth + 1), encoding));
  }
}

TEST(ATreesText, IsRefusedWhereverItIsCut) {
  const Value tree = Array{Array{1, -1, 0.5, true, Value(), Date{0}, Value::Bytes{1, 2}, ~0ULL, 65536},
                           Dictionary{{"\u00e9\U0001F600", "a string with a long length"}}};
  const std::pair<TreeReader, std::string> samples[] = {
      {readJSON, R"({"a": [1, -2.5e-3, 18446744073709551615, "\u00e9\n\ud83d\ude00é😀"], "b": {"": null}})"},
      {readPropertyList, "{ a = (1, \"\\U00e9\\101 \u00e9\", <0aFf 01>); /* c */ 'b' = { c = d; }; }"},
      {readPropertyList,
       "<?xml version='1.0' encoding='UTF-8'?><plist version='1.0'><dict><key>k\u00e9</key><array>"
       "<integer>-12</integer><real>1e3</real><true/><date>2024-02-29T00:00:00Z</date><data>AQIDBA==</data>"
       "</array><key>s</key><string>&lt;\U0001F600&#13;</string></dict></plist>"},
      {readBinaryPropertyList, *writePropertyList(tree, kBinary)}};
  for (const auto& [read, sample] : samples) {
    ASSERT_TRUE(read(sample));
    for (std::size_t i = 0; i < sample.size(); ++i) EXPECT_FALSE(read(sample.substr(0, i))) << i;
  }
}

}  // namespace
}  // namespace kvr
