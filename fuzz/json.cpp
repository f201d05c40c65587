// The service's answers: from JSON to a record, and through every form of a record.
#include "platform/codec/JSON.h"

#include "Fuzz.h"
#include "core/warranty/KVRWarranty.h"
#include "simulated/SimulatedPlatform.h"

namespace kvr::fuzz {
namespace {

void requireForms(const Value& tree) {
  SimulatedPlatform simulated;
  const auto warranty = KVRWarranty::warrantyWithDictionary(simulated.platform, tree);
  require((warranty != nullptr) == tree.isDictionary(), "a dictionary, and nothing else, is a record");
  if (!warranty) return;
  require(warranty->dictionaryRepresentation() == tree, "a record keeps its dictionary");
  const auto coded = KVRWarranty::initWithCoder(simulated.platform, warranty->encodeWithCoder());
  require(coded && coded->isEqual(*warranty), "coding gives the record back");
  warranty->cacheWarranty("SERIAL");
  const auto cached = KVRWarranty::cachedWarrantyForSerialNumber(simulated.platform, "SERIAL");
  if (writePropertyList(tree, PropertyListEncoding::XML)) {
    require(cached && cached->isEqual(*warranty), "the cache gives the record back");
  } else {
    require(!cached, "what the cache cannot hold is not in it");
  }
  require(simulated.log.texts(LogLevel::Error).empty(), "nothing of that is an error");
  static_cast<void>(warranty->daysEligible());
  static_cast<void>(warranty->zubLocalizedOfferDesc());
  static_cast<void>(warranty->zubLocalizedOfferDetailsEligibility());
}

}  // namespace

void run(std::string_view input) {
  const auto tree = readJSON(input);
  if (!tree) {
    require(tree.error().domain == "json" && !tree.error().message.empty(), "an error says what it is");
    return;
  }
  for (const auto slashes : {JSONSlashes::Plain, JSONSlashes::Escaped}) {
    const auto text = writeJSON(*tree, slashes);
    require(bool(text), "a tree that was read can be written");
    const auto again = readJSON(*text);
    require(again && *again == *tree, "JSON gives the tree back");
  }
  requireRoundTrips(*tree);
  requireForms(*tree);
}

}  // namespace kvr::fuzz
