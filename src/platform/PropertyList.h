#pragma once

#include "platform/Error.h"
#include "platform/Value.h"

#include <string>
#include <string_view>

namespace kvr {

enum class PropertyListEncoding { XML, Binary };

/// How deep containers may be nested in any tree that is read (the top level is 1).
inline constexpr std::size_t kMaximumDepth = 512;

/// Reads a property list in any encoding: XML, binary, or the old ASCII form.
///
/// Takes any bytes: what is no property list, is nested deeper than `kMaximumDepth`, or unfolds to more than
/// a bounded number of values is an error in domain "plist". Short memory says nothing about the bytes: it is
/// std::bad_alloc, never an error. Thread-safe, no state.
Result<Value> readPropertyList(std::string_view bytes);

/// As above, for what a stranger has sent and is kept or logged: an error too are more than `largest` bytes,
/// and a tree of more than `largest` values or bytes of text and data, where what a binary list shares counts
/// wherever it stands.
Result<Value> readPropertyListWithin(std::size_t largest, std::string_view bytes);

/// Writes a tree. XML holds no null, no character that XML forbids and no date outside the calendar, and
/// drops a date's fraction of a second; the binary encoding holds every tree (a date before 1985 to a tenth
/// of a microsecond). A tree that does not fit, whose text is not UTF-8, or that `readPropertyList` would
/// refuse for its depth or number of values is an error in domain "plist".
Result<std::string> writePropertyList(const Value& tree, PropertyListEncoding encoding);

}  // namespace kvr
