#include "Fuzz.h"

#include "platform/codec/PropertyList.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>

namespace kvr::fuzz {

void require(bool holds, const char* what, const std::string& detail) {
  if (holds) return;
  std::fprintf(stderr, "does not hold: %s %s\n", what, detail.c_str());
  std::abort();
}

void requireRoundTrips(const Value& tree) {
  const auto binary = writePropertyList(tree, PropertyListEncoding::Binary);
  require(bool(binary), "a tree that was read can be written in binary");
  const auto again = readPropertyList(*binary);
  require(again && *again == tree, "binary gives the tree back");
  const auto xml = writePropertyList(tree, PropertyListEncoding::XML);
  if (!xml) return;
  const auto fromXML = readPropertyList(*xml);
  require(bool(fromXML), "XML that was written can be read");
  // XML drops the fractions of dates the first time.
  const auto second = writePropertyList(*fromXML, PropertyListEncoding::XML);
  require(second && *second == *xml, "XML gives the tree back");
}

namespace {

/// Checks that reading only the top level gives the same entries as the whole tree.
void requireSameTopLevel(std::string_view input, const Value& tree) {
  if (!tree.isDictionary() || tree.dictionary().empty()) return;
  const auto& [key, value] = *tree.dictionary().rbegin();
  // In a binary list, only such keys are searched for.
  if (!std::ranges::all_of(key, [](char c) { return static_cast<unsigned char>(c) < 0x80; })) return;
  const std::string_view keys[] = {key};
  const auto part = readPropertyListWithin({0, 0}, input, keys);
  require(part && !part->isWhole, "the top level can be read alone");
  const auto expected = value.isArray()        ? Value(Value::Array())
                        : value.isDictionary() ? Value(Value::Dictionary())
                                               : value;
  require(part->tree == Value(Value::Dictionary{{key, expected}}), "the top level is the same");
}

}  // namespace

void readAndWriteBack(std::string_view input, Result<Value> (*read)(std::string_view)) {
  const auto tree = read(input);
  if (const auto list = readPropertyList(input)) requireSameTopLevel(input, *list);
  if (!tree) {
    require(tree.error().domain == "plist" && !tree.error().message.empty(), "an error says what it is");
    return;
  }
  require(!describe(*tree).empty() || *tree == Value(""), "a tree can be described");
  requireRoundTrips(*tree);
}

}  // namespace kvr::fuzz
