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
/// Accepts any bytes. Input that is not a property list, is nested deeper than `kMaximumDepth`, or expands to
/// too many values is an error in domain "plist". Running out of memory throws std::bad_alloc instead, so
/// that good input is never taken for damaged. Thread-safe, no state.
Result<Value> readPropertyList(std::string_view bytes);

/// A limit on the size of a tree. What a binary list shares counts once for each use. For the other
/// encodings, which cannot share, text is not counted.
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

/// As `readPropertyList`, for untrusted input that is to be stored or logged. If a list exceeds `most` or is
/// nested too deep, only its top level is read: the entries of a dictionary under `keys`, with containers as
/// empty ones. The rest is skipped whatever its size; in a binary list it is not even checked.
Result<PartialTree> readPropertyListWithin(const TreeExtent& most, std::string_view bytes, EntryKeys keys);

/// Writes a tree. XML cannot hold a null, a character that XML forbids or a date outside the calendar, and
/// drops a date's fraction of a second; the binary encoding can hold every tree (a date before 1985 to a
/// tenth of a microsecond). It is an error in domain "plist" if the encoding cannot hold the tree, its text
/// is not UTF-8, or `readPropertyList` would refuse it for its depth or number of values.
Result<std::string> writePropertyList(const Value& tree, PropertyListEncoding encoding);

}  // namespace kvr
