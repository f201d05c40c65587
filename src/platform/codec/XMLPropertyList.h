#pragma once

#include "platform/codec/TreeBuilder.h"
#include "platform/value/Error.h"
#include "platform/value/Value.h"

#include <string>
#include <string_view>

namespace kvr {

/// The XML encoding of property lists; `PropertyList.h` is what others use.
///
/// Reads a document in any encoding that Expat knows, from its XML declaration, document type or root on. A
/// document type may stand there but may declare nothing.
Result<Value> readXMLPropertyList(std::string_view bytes);
/// The tree as far as the builder takes it.
Result<Value> readXMLPropertyList(std::string_view bytes, TreeBuilder builder);

/// Writes UTF-8 without document type, an element a line.
Result<std::string> writeXMLPropertyList(const Value& tree);

}  // namespace kvr
