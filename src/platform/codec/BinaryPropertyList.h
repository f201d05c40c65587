#pragma once

#include "platform/codec/PropertyList.h"
#include "platform/value/Error.h"
#include "platform/value/Value.h"

#include <string>
#include <string_view>

namespace kvr {

// The binary encoding of property lists; `PropertyList.h` is what others use.
//
// A file has eight bytes of header, the *objects* one after another, a table of their offsets, and a trailer
// that locates the table. A container holds *references*, which are indices into the table, so objects can be
// shared; all numbers are big-endian. An object starts with a marker: its kind in the high four bits, and in
// the low four its length, where 15 means that an integer object with the length follows.

Result<Value> readBinaryPropertyList(std::string_view bytes);
/// As `readPropertyListWithin`.
Result<PartialTree> readBinaryPropertyListWithin(const TreeExtent& most, std::string_view bytes,
                                                 EntryKeys keys);

/// Writes equal leaves once, within the sharing limit of the reader.
Result<std::string> writeBinaryPropertyList(const Value& tree);

namespace binary_property_list {

inline constexpr std::string_view kHeader = "bplist00";
inline constexpr std::size_t kTrailerSize = 32;
/// 2001-01-01 00:00 UTC, from which dates are counted, in seconds since 1970.
inline constexpr double kReferenceDate = 978307200;

/// By how many bytes shared text and data may make a tree larger than its file. Real files share far less,
/// mostly keys, and this much still fits in memory.
inline constexpr std::size_t kMaximumSharedBytes = std::size_t{1} << 26U;

/// The high four bits of a marker.
enum class Kind : unsigned {
  Singleton = 0x0,
  Int = 0x1,
  Real = 0x2,
  Date = 0x3,
  Data = 0x4,
  ASCIIString = 0x5,
  UTF16String = 0x6,
  Array = 0xA,
  Dictionary = 0xD,
};

// The low four bits of a singleton's marker.
inline constexpr unsigned kNull = 0x0;
inline constexpr unsigned kFalse = 0x8;
inline constexpr unsigned kTrue = 0x9;

/// The low four bits of a marker whose length does not fit in them.
inline constexpr unsigned kLengthFollows = 0xF;

}  // namespace binary_property_list
}  // namespace kvr
