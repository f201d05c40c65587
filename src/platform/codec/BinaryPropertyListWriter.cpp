#include "platform/codec/BinaryPropertyList.h"
#include "platform/codec/PropertyList.h"
#include "platform/codec/PropertyListLimits.h"
#include "platform/text/UTF8.h"

#include <algorithm>
#include <bit>
#include <memory_resource>
#include <span>
#include <string_view>
#include <unordered_map>
#include <vector>

namespace kvr {
namespace {

using namespace binary_property_list;

/// How many bytes the number needs; 1 to 8.
std::size_t sizeOf(std::uint64_t number) {
  return std::max<std::size_t>((static_cast<std::size_t>(std::bit_width(number)) + 7) / 8, 1);
}

void appendNumber(std::string& out, std::uint64_t number, std::size_t size) {
  for (auto shift = size * 8; shift > 0;) {
    shift -= 8;
    out += static_cast<char>(number >> shift & 0xFFU);
  }
}

void appendMarker(std::string& out, Kind kind, unsigned low) {
  out += static_cast<char>(static_cast<unsigned>(kind) << 4U | low);
}

/// Up to four bytes are unsigned, eight are signed; the low bits of the marker are the logarithm of the size.
void appendInteger(std::string& out, std::uint64_t number) {
  const std::size_t size = std::bit_ceil(sizeOf(number));
  appendMarker(out, Kind::Int, static_cast<unsigned>(std::countr_zero(size)));
  appendNumber(out, number, size);
}

/// A number above the signed 64-bit range needs sixteen bytes.
void appendLargeInteger(std::string& out, std::uint64_t number) {
  appendMarker(out, Kind::Int, 4);
  appendNumber(out, 0, 8);
  appendNumber(out, number, 8);
}

void appendReal(std::string& out, Kind kind, double number) {
  appendMarker(out, kind, 3);
  appendNumber(out, std::bit_cast<std::uint64_t>(number), 8);
}

void appendLength(std::string& out, Kind kind, std::size_t length) {
  if (length < kLengthFollows) return appendMarker(out, kind, static_cast<unsigned>(length));
  appendMarker(out, kind, kLengthFollows);
  appendInteger(out, length);
}

/// Numbers the objects first, which gives the size of references, and then writes them. Recurses once per
/// level, `kMaximumDepth` levels at most.
class Writer {
 public:
  Result<std::string> write(const Value& tree) {
    if (!addValue(tree)) return plistError(problem_);
    return writeObjects();
  }

 private:
  using Reference = std::uint32_t;
  static constexpr std::size_t kFirstBlock = 16384;  ///< bytes: enough for the answer about one device

  struct Object {
    std::string_view bytes;           ///< all of a leaf; the part of a container before its references
    std::span<Reference> references;  ///< of a container
  };

  bool refuse(const char* problem) {
    problem_ = problem;
    return false;
  }

  // Each of them leaves the number of the object in `added_`.
  bool addValue(const Value& value);
  bool addString(const std::string& text);
  void addLeaf();
  bool addArray(const Value::Array& array);
  bool addDictionary(const Value::Dictionary& dictionary);

  /// Numbers a container before what is in it, so that the tree's root is the first object.
  Object addContainer(Kind kind, std::size_t count, std::size_t references);
  /// A copy of the bytes in `memory_`.
  std::string_view kept(std::string_view bytes);
  std::string writeObjects() const;

  /// Owns the bytes that the objects refer to, and the table of leaves, until everything is written.
  std::pmr::monotonic_buffer_resource memory_{kFirstBlock};
  std::vector<Object> objects_;
  std::pmr::unordered_map<std::string_view, Reference> leaves_{&memory_};
  std::string leaf_;  ///< the bytes of the leaf that is being added
  Reference added_ = 0;
  std::size_t sharedBytes_ = 0;
  std::size_t depth_ = 0;
  std::size_t values_ = 0;
  const char* problem_ = "";
};

bool Writer::addValue(const Value& value) {
  if (++values_ > kMaximumValues) return refuse("too many values");
  leaf_.clear();
  switch (value.kind()) {
    case Value::Kind::Null:
      appendMarker(leaf_, Kind::Singleton, kNull);
      break;
    case Value::Kind::Bool:
      appendMarker(leaf_, Kind::Singleton, value.boolean() ? kTrue : kFalse);
      break;
    case Value::Kind::Int:
      appendInteger(leaf_, static_cast<std::uint64_t>(value.integer()));
      break;
    case Value::Kind::UInt:
      appendLargeInteger(leaf_, value.unsignedInteger());
      break;
    case Value::Kind::Real:
      appendReal(leaf_, Kind::Real, value.real());
      break;
    case Value::Kind::Date:
      appendReal(leaf_, Kind::Date, value.date().secondsSince1970 - kReferenceDate);
      break;
    case Value::Kind::Data:
      appendLength(leaf_, Kind::Data, value.data().size());
      leaf_.append(value.data().begin(), value.data().end());
      break;
    case Value::Kind::String:
      return addString(value.string());
    case Value::Kind::Array:
      return addArray(value.array());
    case Value::Kind::Dictionary:
      return addDictionary(value.dictionary());
  }
  addLeaf();
  return true;
}

bool Writer::addString(const std::string& text) {
  leaf_.clear();
  if (std::all_of(text.begin(), text.end(), [](char c) { return static_cast<unsigned char>(c) < 0x80; })) {
    appendLength(leaf_, Kind::ASCIIString, text.size());
    leaf_ += text;
  } else {
    const auto units = utf16FromUTF8(text);
    if (!units) return refuse("text that is not UTF-8");
    appendLength(leaf_, Kind::UTF16String, units->size() / 2);
    leaf_ += *units;
  }
  addLeaf();
  return true;
}

void Writer::addLeaf() {
  const auto bytes = kept(leaf_);
  added_ = static_cast<Reference>(objects_.size());
  const auto [equal, isNew] = leaves_.try_emplace(bytes, added_);
  if (!isNew && sharedBytes_ + bytes.size() <= kMaximumSharedBytes) {
    sharedBytes_ += bytes.size();
    added_ = equal->second;
    return;
  }
  objects_.push_back({bytes, {}});
}

std::string_view Writer::kept(std::string_view bytes) {
  auto* const copy = static_cast<char*>(memory_.allocate(bytes.size(), 1));
  bytes.copy(copy, bytes.size());
  return {copy, bytes.size()};
}

Writer::Object Writer::addContainer(Kind kind, std::size_t count, std::size_t references) {
  leaf_.clear();
  appendLength(leaf_, kind, count);
  std::pmr::polymorphic_allocator<Reference> allocator(&memory_);
  return objects_.emplace_back(Object{kept(leaf_), {allocator.allocate(references), references}});
}

bool Writer::addArray(const Value::Array& array) {
  if (depth_ == kMaximumDepth) return refuse("nested too deep");
  ++depth_;
  const auto number = static_cast<Reference>(objects_.size());
  const auto references = addContainer(Kind::Array, array.size(), array.size()).references;
  for (std::size_t i = 0; i < array.size(); ++i) {
    if (!addValue(array[i])) return false;
    references[i] = added_;
  }
  added_ = number;
  --depth_;
  return true;
}

bool Writer::addDictionary(const Value::Dictionary& dictionary) {
  if (depth_ == kMaximumDepth) return refuse("nested too deep");
  ++depth_;
  const auto number = static_cast<Reference>(objects_.size());
  const auto references = addContainer(Kind::Dictionary, dictionary.size(), 2 * dictionary.size()).references;
  auto next = references.begin();
  for (const auto& [key, element] : dictionary) {
    if (!addString(key)) return false;
    *next++ = added_;
  }
  for (const auto& [key, element] : dictionary) {
    if (!addValue(element)) return false;
    *next++ = added_;
  }
  added_ = number;
  --depth_;
  return true;
}

std::string Writer::writeObjects() const {
  const auto referenceSize = sizeOf(objects_.size() - 1);
  std::string out(kHeader);
  std::vector<std::uint64_t> offsets;
  offsets.reserve(objects_.size());
  for (const auto& object : objects_) {
    offsets.push_back(out.size());
    out += object.bytes;
    for (const auto reference : object.references) appendNumber(out, reference, referenceSize);
  }
  const auto table = out.size();
  const auto offsetSize = sizeOf(table);
  for (const auto offset : offsets) appendNumber(out, offset, offsetSize);
  constexpr std::size_t kUnused = 6;
  out.append(kUnused, '\0');
  appendNumber(out, offsetSize, 1);
  appendNumber(out, referenceSize, 1);
  appendNumber(out, objects_.size(), 8);
  appendNumber(out, 0, 8);  // the top object
  appendNumber(out, table, 8);
  return out;
}

}  // namespace

Result<std::string> writeBinaryPropertyList(const Value& tree) { return Writer().write(tree); }

}  // namespace kvr
