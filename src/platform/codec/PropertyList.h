#pragma once

#include "platform/value/Error.h"
#include "platform/value/Value.h"

#include <cstddef>
#include <span>
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

/// How much there may be of a tree. What a binary list shares counts wherever it stands; the text of the
/// other encodings, which share nothing, is not counted.
struct TreeExtent {
  std::size_t values;
  std::size_t textBytes;  ///< of text and data, keys included
};

/// A tree, or what could be read of it.
struct PartialTree {
  Value tree;
  bool isWhole = true;
};

using EntryKeys = std::span<const std::string_view>;

/// As above, for what a stranger has sent and is kept or logged. Of a list that holds more than `most`, or is
/// nested too deep, only what stands at the top level is read: of a dictionary the entries under `keys`, each
/// container as an empty one. The rest may then be of any size; of a binary list it is not looked at.
Result<PartialTree> readPropertyListWithin(const TreeExtent& most, std::string_view bytes, EntryKeys keys);

/// Writes a tree. XML holds no null, no character that XML forbids and no date outside the calendar, and
/// drops a date's fraction of a second; the binary encoding holds every tree (a date before 1985 to a tenth
/// of a microsecond). A tree that does not fit, whose text is not UTF-8, or that `readPropertyList` would
/// refuse for its depth or number of values is an error in domain "plist".
Result<std::string> writePropertyList(const Value& tree, PropertyListEncoding encoding);

}  // namespace kvr
