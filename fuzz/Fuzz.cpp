#include "Fuzz.h"

#include "platform/PropertyList.h"

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
  // Dates lose their fractions the first time.
  const auto second = writePropertyList(*fromXML, PropertyListEncoding::XML);
  require(second && *second == *xml, "XML gives the tree back");
}

void readAndWriteBack(std::string_view input, Result<Value> (*read)(std::string_view)) {
  const auto tree = read(input);
  static_cast<void>(readPropertyList(input));
  if (!tree) {
    require(tree.error().domain == "plist" && !tree.error().message.empty(), "an error says what it is");
    return;
  }
  require(!describe(*tree).empty() || *tree == Value(""), "a tree can be described");
  requireRoundTrips(*tree);
}

}  // namespace kvr::fuzz
