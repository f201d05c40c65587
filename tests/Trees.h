#pragma once

#include "Prelude.h"
#include "platform/codec/JSON.h"
#include "platform/text/UTF8.h"

namespace kvr {

/// Boundary values of every leaf type that JSON, XML and the binary encoding have in common.
inline Value treeForEveryEncoding() {
  std::string planes;
  for (char32_t plane = 0; plane <= 16; ++plane) appendUTF8(planes, plane * 0x10000 + 0x1234);
  return Dictionary{
      {"integers", Array{0, -1, 127, 255, 256, 65535, 65536, 4294967295, 4294967296, 10'000'000'000,
                         std::numeric_limits<std::int64_t>::min(), std::numeric_limits<std::int64_t>::max(),
                         std::uint64_t{1} << 63U, std::numeric_limits<std::uint64_t>::max()}},
      {"reals", Array{0.1, 1e300, -0.0, 1.0, 5e-324, 1.7976931348623157e308, 1e22, 123456789012.0}},
      {"bools", Array{true, false}},
      {"empty", Array{"", Array{}, Dictionary{}, Dictionary{{"", ""}}}},
      {"planes", planes},
      {"line breaks", "a\nb\rc\r\nd\u0085e\u2028f\u2029\r\n"},
      {"blanks", "  leading, trailing and \t tab \n"},
      {"markup", "<&>\"'/\\ ]]> &amp; %@ {} ();=//"},
      {std::string(300, 'k'), std::string(70000, 'v')},
      {"\u00e9<&>\r\U0001F600", "key"}};
}

inline Value nestedArrays(std::size_t depth) {
  Value tree = "innermost";
  for (std::size_t i = 0; i < depth; ++i) tree = Array{tree};
  return tree;
}

inline std::string repeated(std::string_view text, std::size_t times) {
  std::string out;
  for (std::size_t i = 0; i < times; ++i) out += text;
  return out;
}

using TreeReader = std::function<Result<Value>(std::string_view)>;
using TreesByText = std::vector<std::pair<std::string, Value>>;
using FaultsByText = std::vector<std::pair<std::string, std::string>>;

inline void expectTrees(const TreeReader& read, const TreesByText& cases) {
  for (const auto& [text, tree] : cases) {
    const auto found = read(text);
    ASSERT_TRUE(found) << text << ": " << found.error().message;
    EXPECT_EQ(*found, tree) << text;
    EXPECT_EQ(found->kind(), tree.kind()) << text;
  }
}

inline void expectFaults(const TreeReader& read, const std::string& domain, const FaultsByText& cases) {
  for (const auto& [text, message] : cases) {
    const auto found = read(text);
    ASSERT_FALSE(found) << text;
    EXPECT_EQ(found.error(), (Error{domain, 0, message})) << text;
  }
}

}  // namespace kvr
