#include "platform/PropertyList.h"
#include "unit/platform/Trees.h"

#include <cmath>

namespace kvr {
namespace {

std::string document(std::string_view content) {
  return "<plist version=\"1.0\">" + std::string(content) + "</plist>";
}

TEST(AnXMLElement, IsReadAsItsKind) {
  constexpr auto kInfinity = std::numeric_limits<double>::infinity();
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
      {"<array><dict/><array></array></array>", Value::Array{Value::Dictionary{}, Value::Array{}}},
      {"<dict><key>a</key><integer>1</integer><key/><true/><key>a</key><integer>2</integer></dict>",
       Value::Dictionary{{"", true}, {"a", 2}}},
  };
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
      {"plist", {"", "text", "<true/><true/>", "<unknown/>", "<plist><true/></plist>", "<key>k</key>"}},
  };
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
  const std::string types[] = {
      "<!DOCTYPE plist [<!ENTITY e 'text'>]>",
      "<!DOCTYPE plist [<!ENTITY e SYSTEM 'file:///etc/hostname'>]>",
      "<!DOCTYPE plist [<!ENTITY a 'aaaaaaaa'><!ENTITY b '&a;&a;&a;&a;'><!ENTITY e '&b;&b;&b;&b;'>]>",
      "<!DOCTYPE plist [<!ENTITY % p SYSTEM 'file:///etc/hostname'> %p;]>",
      "<!DOCTYPE plist SYSTEM 'file:///etc/hostname'>",
      ""};
  for (const auto& type : types)
    EXPECT_FALSE(readPropertyList("<?xml version='1.0'?>" + type + content)) << type;
}

TEST(AnXMLPropertyList, IsWrittenAnElementALineWithoutDocumentType) {
  const Value tree = Value::Dictionary{
      {"a&b", Value::Array{1, 0.5, true, Date{-0.5}, Value::Array{}}},
      {"d", Value::Bytes{1, 2, 3, 4}},
      {"t", "x\r<\n"},
  };
  EXPECT_EQ(
      *writePropertyList(tree, PropertyListEncoding::XML),
      "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n<dict>\n\t<key>a&amp;b</key>\n"
      "\t<array>\n\t\t<integer>1</integer>\n\t\t<real>0.5</real>\n\t\t<true/>\n"
      "\t\t<date>1969-12-31T23:59:59Z</date>\n\t\t<array/>\n\t</array>\n\t<key>d</key>\n\t<data>\n"
      "\tAQIDBA==\n\t</data>\n\t<key>t</key>\n\t<string>x&#13;&lt;\n</string>\n</dict>\n</plist>\n");
}

TEST(AnXMLPropertyList, ThatIsHostileDoesNoHarm) {
  for (const auto* tag : {"<array>", "<dict><key>k</key>", "<unknown>"}) {
    EXPECT_FALSE(readPropertyList("<plist>" + repeated(tag, 100'000)));
  }
  expectDamageIsHarmless(
      "<?xml version='1.0' encoding='UTF-8'?><plist "
      "version='1.0'><dict><key>k\u00e9</key><array><integer>-12</integer>"
      "<real>1e3</real><true/><date>2024-02-29T00:00:00Z</date><data>AQIDBA==</data></array><key>s</key>"
      "<string>&lt;\U0001F600&#13;</string></dict></plist>",
      readPropertyList);
}

}  // namespace
}  // namespace kvr
