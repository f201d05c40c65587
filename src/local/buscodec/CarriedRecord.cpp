#include "local/buscodec/CarriedRecord.h"

#include "platform/codec/PropertyList.h"
#include "platform/text/UTF8.h"

#include <cerrno>
#include <string>
#include <utility>

namespace kvr {
namespace {

/// The most containers that are used; the rest of the bus's limit is left to programs between here and a
/// client.
constexpr int kUsedContainers = 56;

// The containers added around an element: for an array the array and the variant; for a dictionary its entry
// too.
constexpr int kAroundElement = 2;
constexpr int kAroundEntry = 3;

bool canCarryKeys(const Value::Dictionary& dictionary) {
  for (const auto& entry : dictionary) {
    if (!busCanCarryText(entry.first)) return false;
  }
  return true;
}

/// Whether a tree can be sent in a variant that is the innermost of `containers` containers.
bool canCarry(const Value& tree, int containers) {
  if (containers > kUsedContainers) return false;
  switch (tree.kind()) {
    case Value::Kind::Null:
      return false;
    case Value::Kind::String:
      return busCanCarryText(tree.string());
    case Value::Kind::Date:
    case Value::Kind::Data:
      return containers + 1 <= kUsedContainers;
    case Value::Kind::Array:
      for (const Value& element : tree.array()) {
        if (!canCarry(element, containers + kAroundElement)) return false;
      }
      return containers + kAroundElement <= kUsedContainers;
    case Value::Kind::Dictionary:
      for (const auto& [key, value] : tree.dictionary()) {
        if (!busCanCarryText(key) || !canCarry(value, containers + kAroundEntry)) return false;
      }
      return containers + kAroundEntry <= kUsedContainers;
    default:
      return true;
  }
}

bool looksPacked(const Value& tree) {
  if (!tree.isData()) return false;
  const Value::Bytes& bytes = tree.data();
  return std::string_view(reinterpret_cast<const char*>(bytes.data()), bytes.size())
      .starts_with(kBinaryPropertyListStart);
}

Result<Value> packed(const Value& tree) {
  const Result<std::string> bytes = writePropertyList(tree, PropertyListEncoding::Binary);
  if (!bytes) return bytes.error();
  return Value(Value::Bytes(bytes->begin(), bytes->end()));
}

/// `level` is 0 for the value's own dictionary. Unchanged parts are shared, not copied.
Result<Value> carriedRecordAt(int level, const Value& record, int containers) {
  std::optional<Value::Dictionary> changed;
  for (const auto& [key, value] : record.dictionary()) {
    const int inside = containers + kAroundEntry;
    const bool isRecord =
        value.isDictionary() && level + 1 < kBusRecordLevels && canCarryKeys(value.dictionary());
    if (!isRecord && canCarry(value, inside) && !looksPacked(value)) continue;
    Result<Value> carried = isRecord ? carriedRecordAt(level + 1, value, inside) : packed(value);
    if (!carried) return carried;
    if (isRecord && &carried->dictionary() == &value.dictionary()) continue;
    if (!changed) changed = record.dictionary();
    changed->insert_or_assign(key, *std::move(carried));
  }
  return changed ? Value(*std::move(changed)) : record;
}

constexpr std::size_t aligned(std::size_t offset, std::size_t alignment) {
  return (offset + alignment - 1) / alignment * alignment;
}

std::size_t endOfText(std::size_t offset, std::string_view text) {
  return aligned(offset, 4) + 4 + text.size() + 1;
}

/// The end of a variant that begins at `offset`. Its signature has a length byte before it and a NUL after
/// it.
std::size_t endOfVariant(std::size_t offset, const Value& tree) {
  const auto content = [offset](std::string_view signature, std::size_t alignment) {
    return aligned(offset + signature.size() + 2, alignment);
  };
  switch (tree.kind()) {
    case Value::Kind::Null:
      return offset;
    case Value::Kind::Bool:
      return content("b", 4) + 4;
    case Value::Kind::String:
      return endOfText(content("s", 4), tree.string());
    case Value::Kind::Int:
    case Value::Kind::UInt:
    case Value::Kind::Real:
      return content("x", 8) + 8;
    case Value::Kind::Date:
      return content("(d)", 8) + 8;
    case Value::Kind::Data:
      return content("ay", 4) + 4 + tree.data().size();
    case Value::Kind::Array: {
      std::size_t end = content("av", 4) + 4;
      for (const Value& element : tree.array()) end = endOfVariant(end, element);
      return end;
    }
    case Value::Kind::Dictionary:
      return endOnBus(content("a{sv}", 4), tree.dictionary());
  }
  return offset;
}

}  // namespace

bool busCanCarryText(std::string_view text) {
  for (std::size_t at = 0; at < text.size();) {
    if (static_cast<signed char>(text[at]) > 0) {  // ASCII
      ++at;
      continue;
    }
    // sd-bus refuses noncharacters, although the daemon lets them pass.
    const char32_t point = nextCodePoint(text, at);
    const bool isNoCharacter = (point >= 0xFDD0 && point <= 0xFDEF) || (point & 0xFFFEU) == 0xFFFE;
    if (point == 0 || point == kNoCodePoint || isNoCharacter) return false;
  }
  return true;
}

Result<Value> carriedRecord(const Value& record, int containers) {
  if (!canCarryKeys(record.dictionary()))
    return Error{"bus", EINVAL, "a record has a key that the bus cannot carry"};
  return carriedRecordAt(0, record, containers);
}

std::size_t endOnBus(std::size_t offset, const Value::Dictionary& record) {
  std::size_t end = aligned(aligned(offset, 4) + 4, 8);
  for (const auto& [key, value] : record) end = endOfVariant(endOfText(aligned(end, 8), key), value);
  return end;
}

}  // namespace kvr
