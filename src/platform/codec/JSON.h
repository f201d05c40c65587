#pragma once

#include "platform/value/Error.h"
#include "platform/value/Value.h"

#include <string>
#include <string_view>

namespace kvr {

/// Reads one JSON text (RFC 8259, UTF-8). Whole numbers that fit 64 bits come back as integers, every other
/// number as a real; the last of equal keys wins. Anything else, or nesting deeper than `kMaximumDepth` of
/// PropertyList.h, is an error in domain "json"; running out of memory throws std::bad_alloc. The caller
/// limits the size.
Result<Value> readJSON(std::string_view bytes);

enum class JSONSlashes { Plain, Escaped };

/// Writes a tree compactly, without whitespace; with `Escaped` every "/" in a string is written "\/".
/// A date, data, a number that is not finite, or text that is not UTF-8 is an error in domain "json".
Result<std::string> writeJSON(const Value& tree, JSONSlashes slashes = JSONSlashes::Plain);

}  // namespace kvr
