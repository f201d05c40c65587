#pragma once

#include "platform/codec/TreeBuilder.h"
#include "platform/value/Error.h"
#include "platform/value/Value.h"

#include <string_view>

namespace kvr {

/// Reads the old text encoding of property lists: `{ key = value; }`, `(a, b)`, `<0fbd77 1c2735ae>`, words
/// and quoted strings, with `//` and `/* */` comments; or a table of strings, `"KEY" = "text";` without
/// braces. UTF-8, or UTF-16 with a byte order mark. Every leaf is a string or data.
Result<Value> readASCIIPropertyList(std::string_view bytes);
/// The same with a builder that may take only a part of the tree.
Result<Value> readASCIIPropertyList(std::string_view bytes, TreeBuilder builder);

}  // namespace kvr
