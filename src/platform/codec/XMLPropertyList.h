#pragma once

#include "platform/codec/TreeBuilder.h"
#include "platform/value/Error.h"
#include "platform/value/Value.h"

#include <string>
#include <string_view>

namespace kvr {

/// The XML encoding of property lists; `PropertyList.h` is what others use.
///
/// Reads a document in any encoding that Expat knows, starting at its XML declaration, document type or root
/// element. A document type is allowed but must not declare anything.
Result<Value> readXMLPropertyList(std::string_view bytes);
/// The same with a builder that may take only a part of the tree.
Result<Value> readXMLPropertyList(std::string_view bytes, TreeBuilder builder);

/// Writes UTF-8 without a document type, one element per line.
Result<std::string> writeXMLPropertyList(const Value& tree);

}  // namespace kvr
