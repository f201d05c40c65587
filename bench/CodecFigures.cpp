// Reading and writing 6 kB of JSON, XML and binary property list.

#include "CoverageAnswer.h"
#include "Figures.h"
#include "Measurement.h"
#include "platform/codec/JSON.h"
#include "platform/codec/PropertyList.h"

#include <expat.h>
#include <nlohmann/json.hpp>

#include <cstdint>
#include <memory>
#include <stdexcept>

namespace kvr::bench {
namespace {

/// Stops the compiler from removing an unused result.
template <class T>
void keep(const T& made) {
  asm volatile("" : : "g"(&made) : "memory");
}

/// The average seconds per run.
double repeated(const std::function<void()>& work) {
  constexpr int kRuns = 300;
  return secondsOf([&] {
           for (int i = 0; i < kRuns; ++i) work();
         }) /
         kRuns;
}

void compare(const char* figure, const char* goal, const std::function<void()>& ours,
             const std::function<void()>& theirs) {
  printRow({figure, goal, "µs", 1e6, 1},
           inTurns([&] { return repeated(ours); }, [&] { return repeated(theirs); }));
}

void parseWithEmptyHandlers(const std::string& text) {
  const std::unique_ptr<XML_ParserStruct, void (*)(XML_Parser)> parser(XML_ParserCreate("UTF-8"),
                                                                       XML_ParserFree);
  XML_SetElementHandler(
      parser.get(), [](void*, const XML_Char*, const XML_Char**) {}, [](void*, const XML_Char*) {});
  XML_SetCharacterDataHandler(parser.get(), [](void*, const XML_Char*, int) {});
  if (XML_Parse(parser.get(), text.data(), static_cast<int>(text.size()), 1) != XML_STATUS_OK) {
    throw std::runtime_error("Expat refuses the property list");
  }
}

}  // namespace

void codecs() {
  const std::string json = coverageAnswer();
  const Value tree = *readJSON(json);
  const std::string xml = *writePropertyList(tree, PropertyListEncoding::XML);
  const std::string binary = *writePropertyList(tree, PropertyListEncoding::Binary);
  const auto their = nlohmann::json::parse(json);
  const auto packed = nlohmann::json::to_cbor(their);

  compare(
      "JSON read (nlohmann, its own tree)", "≤ 1.5", [&] { keep(*readJSON(json)); },
      [&] { keep(nlohmann::json::parse(json)); });
  compare(
      "JSON written (nlohmann)", "≤ 1.5", [&] { keep(*writeJSON(tree)); }, [&] { keep(their.dump()); });
  compare(
      "XML property list read (Expat, empty handlers)", "≤ 1.5", [&] { keep(*readPropertyList(xml)); },
      [&] { parseWithEmptyHandlers(xml); });
  compare(
      "XML property list written (nlohmann, JSON)", "≤ 1.5",
      [&] { keep(*writePropertyList(tree, PropertyListEncoding::XML)); }, [&] { keep(their.dump()); });
  compare(
      "binary property list read (nlohmann, CBOR)", "≤ 1.5", [&] { keep(*readPropertyList(binary)); },
      [&] { keep(nlohmann::json::from_cbor(packed)); });
  compare(
      "binary property list written (nlohmann, CBOR)", "≤ 1.5",
      [&] { keep(*writePropertyList(tree, PropertyListEncoding::Binary)); },
      [&] { keep(nlohmann::json::to_cbor(their)); });
}

}  // namespace kvr::bench
