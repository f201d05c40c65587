#include "platform/codec/BinaryPropertyList.h"
#include "platform/codec/PropertyList.h"
#include "platform/codec/PropertyListLimits.h"
#include "platform/text/UTF8.h"

#include <algorithm>
#include <bit>
#include <limits>
#include <vector>

namespace kvr {
namespace {

using namespace binary_property_list;

/// The size of a tree, in which a shared object counts once for each use.
struct Extent {
  std::uint64_t values = 0;
  std::uint64_t bytes = 0;  ///< of text and data as they are encoded, keys included

  Extent& operator+=(const Extent& other) {
    values += other.values;
    bytes += other.bytes;
    return *this;
  }
};

/// By sharing, a small input could expand to any size, so the limit depends on the input's size.
Extent largestExtentOf(std::size_t inputSize) {
  constexpr std::uint64_t kValuesOfAnyInput = 1U << 16U;
  constexpr std::uint64_t kValuesPerByte = 16;
  return {std::min(std::uint64_t{kMaximumValues}, kValuesOfAnyInput + kValuesPerByte * inputSize),
          std::uint64_t{kMaximumSharedBytes} + inputSize};
}

/// Reads depth first from the top object, each object once, with an explicit stack instead of recursion.
class Reader {
 public:
  Reader(std::string_view bytes, const Extent& most) : bytes_(bytes), limit_(most) {}

  Result<Value> read() {
    if (!readTrailer() || !enter(top_)) return plistError(problem_);
    while (!open_.empty()) {
      if (!step()) return plistError(problem_);
    }
    return valueOf(objects_[top_]);
  }
  /// Whether the list was refused for its expanded size or its depth, and not for damage.
  bool isTooMuch() const { return isTooMuch_; }

  /// Reads the top level only: the entries of a dictionary under `keys`, with containers as empty ones.
  Result<Value> readTopLevel(EntryKeys keys);

 private:
  enum class State : std::uint8_t { Unread, Open, Read };

  struct Object {
    Value value;            ///< null for a text that nothing but keys has used so far
    std::string_view text;  ///< of an ASCII string
    Extent extent;
    std::uint32_t height = 0;  ///< levels of containers, this one included
    State state = State::Unread;
  };

  /// A container whose references are being followed.
  struct Container {
    std::size_t object;
    bool isDictionary;
    std::size_t at;     ///< where its references start
    std::size_t count;  ///< of values; a dictionary has as many keys before them
    std::size_t next = 0;

    std::size_t references() const { return isDictionary ? 2 * count : count; }
  };

  /// The unread content of an object: where it starts, and how many bytes are left before the table.
  struct Content {
    unsigned lengthBits;
    std::size_t at;
    std::size_t left;
  };

  bool refuse(const char* problem) {
    problem_ = problem;
    return false;
  }
  bool refuseTooMuch(const char* problem) {
    isTooMuch_ = true;
    return refuse(problem);
  }

  /// `size` is 1 to 8; the bytes must lie within the input.
  std::uint64_t number(std::size_t at, std::size_t size) const {
    std::uint64_t value = 0;
    for (std::size_t i = 0; i < size; ++i) value = value << 8U | static_cast<unsigned char>(bytes_[at + i]);
    return value;
  }

  /// The object number in a reference of `container`, not yet checked.
  std::uint64_t reference(const Container& container, std::size_t index) const {
    return number(container.at + index * referenceSize_, referenceSize_);
  }

  bool readTrailer();
  bool enter(std::uint64_t object);
  bool readObject(Object& object, std::size_t index, unsigned marker, Content content);
  bool readLength(Content& content, std::uint64_t& length);
  bool readSingleton(Object& object, unsigned which);
  bool readInteger(Object& object, const Content& content);
  bool readReal(Object& object, const Content& content);
  bool readDate(Object& object, const Content& content);
  bool readBytes(Object& object, Kind kind, Content content);
  bool openContainer(std::size_t object, bool isDictionary, Content content);
  bool step();
  bool closeContainer(const Container& container);
  bool measure(const Container& container);
  bool finish(Object& object, Value value);
  bool finishText(Object& object, std::string_view text);
  static const Value& valueOf(Object& object);
  static bool isString(const Object& object) {
    return object.text.data() != nullptr || object.value.isString();
  }
  bool mayCopy(std::uint64_t bytes);
  bool isText(std::uint64_t object, std::string_view text);
  std::optional<Value> leafOrEmpty(std::uint64_t object);

  const std::string_view bytes_;
  const Extent limit_;
  std::size_t table_ = 0;  ///< where the table of offsets starts, behind all objects
  std::size_t offsetSize_ = 0;
  std::size_t referenceSize_ = 0;
  std::size_t top_ = 0;
  std::vector<Object> objects_;
  std::vector<Container> open_;
  std::uint64_t values_ = 0;  ///< in all containers so far, at most those of the expanded tree
  std::uint64_t copied_ = 0;  ///< bytes of text and data
  const char* problem_ = "";
  bool isTooMuch_ = false;
};

bool Reader::readTrailer() {
  if (!bytes_.starts_with(kHeader)) return refuse("a binary property list of an unknown version");
  if (bytes_.size() < kHeader.size() + kTrailerSize) return refuse("truncated");
  const auto trailer = bytes_.size() - kTrailerSize;
  offsetSize_ = number(trailer + 6, 1);
  referenceSize_ = number(trailer + 7, 1);
  const auto count = number(trailer + 8, 8);
  const auto top = number(trailer + 16, 8);
  const auto table = number(trailer + 24, 8);
  if (offsetSize_ < 1 || offsetSize_ > 8 || referenceSize_ < 1 || referenceSize_ > 8 ||
      table < kHeader.size() || table > trailer || count > (trailer - table) / offsetSize_ || top >= count) {
    return refuse("damaged trailer");
  }
  table_ = table;
  top_ = top;
  objects_.resize(count);
  return true;
}

/// Reads an object for the first time: all of a leaf, or the start of a container.
bool Reader::enter(std::uint64_t object) {
  const auto offset = number(table_ + object * offsetSize_, offsetSize_);
  if (offset < kHeader.size() || offset >= table_) return refuse("an offset outside the objects");
  const auto marker = static_cast<unsigned>(number(offset, 1));
  return readObject(objects_[object], object, marker >> 4U, {marker & 0xFU, offset + 1, table_ - offset - 1});
}

bool Reader::readObject(Object& object, std::size_t index, unsigned kind, Content content) {
  switch (static_cast<Kind>(kind)) {
    case Kind::Singleton:
      return readSingleton(object, content.lengthBits);
    case Kind::Int:
      return readInteger(object, content);
    case Kind::Real:
      return readReal(object, content);
    case Kind::Date:
      return readDate(object, content);
    case Kind::Data:
    case Kind::ASCIIString:
    case Kind::UTF16String:
      return readBytes(object, static_cast<Kind>(kind), content);
    case Kind::Array:
      return openContainer(index, false, content);
    case Kind::Dictionary:
      return openContainer(index, true, content);
  }
  return refuse("an object of unknown kind");
}

/// Reads the length from the start of the content. The caller must compare it with the bytes left.
bool Reader::readLength(Content& content, std::uint64_t& length) {
  length = content.lengthBits;
  if (length != kLengthFollows) return true;
  const auto marker = content.left > 0 ? static_cast<unsigned>(number(content.at, 1)) : 0U;
  const std::size_t size = std::size_t{1} << (marker & 0xFU);
  if (static_cast<Kind>(marker >> 4U) != Kind::Int || size > 8 || content.left < 1 + size) {
    return refuse("damaged length");
  }
  length = number(content.at + 1, size);
  content.at += 1 + size;
  content.left -= 1 + size;
  return true;
}

bool Reader::finish(Object& object, Value value) {
  object.value = std::move(value);
  object.state = State::Read;
  ++object.extent.values;
  return true;
}

/// Most texts are keys, which need no value of their own.
bool Reader::finishText(Object& object, std::string_view text) {
  object.text = text;
  return finish(object, {});
}

const Value& Reader::valueOf(Object& object) {
  if (object.text.data() != nullptr && object.value.isNull()) object.value = object.text;
  return object.value;
}

/// Counts bytes before they are copied; refuses more than the limit. A key is copied for each use and once
/// more as an object of its own; these extra copies are no larger than the input.
bool Reader::mayCopy(std::uint64_t bytes) {
  copied_ += bytes;
  return copied_ <= limit_.bytes + bytes_.size() || refuseTooMuch("unfolds to too much text");
}

bool Reader::readSingleton(Object& object, unsigned which) {
  switch (which) {
    case kNull:
      return finish(object, {});
    case kFalse:
      return finish(object, false);
    case kTrue:
      return finish(object, true);
    default:
      return refuse("an object of unknown kind");
  }
}

/// One, two and four bytes are unsigned, eight are signed, and sixteen are a signed number that must fit 64
/// bits.
bool Reader::readInteger(Object& object, const Content& content) {
  const std::size_t size = std::size_t{1} << content.lengthBits;
  if (size > 16 || size > content.left) return refuse("damaged integer");
  if (size < 8) return finish(object, number(content.at, size));
  if (size == 8) return finish(object, static_cast<std::int64_t>(number(content.at, 8)));
  const auto high = number(content.at, 8);
  const auto low = number(content.at + 8, 8);
  if (high == 0) return finish(object, low);
  const auto negative = static_cast<std::int64_t>(low);
  if (high != std::numeric_limits<std::uint64_t>::max() || negative >= 0) return refuse("integer too large");
  return finish(object, negative);
}

bool Reader::readReal(Object& object, const Content& content) {
  const std::size_t size = std::size_t{1} << content.lengthBits;
  if ((size != 4 && size != 8) || size > content.left) return refuse("damaged real");
  const auto bits = number(content.at, size);
  if (size == 8) return finish(object, std::bit_cast<double>(bits));
  return finish(object, static_cast<double>(std::bit_cast<float>(static_cast<std::uint32_t>(bits))));
}

bool Reader::readDate(Object& object, const Content& content) {
  if (content.lengthBits != 3 || content.left < 8) return refuse("damaged date");
  return finish(object, Date{std::bit_cast<double>(number(content.at, 8)) + kReferenceDate});
}

/// Many objects may refer to the same bytes, so bytes are counted before they are copied.
bool Reader::readBytes(Object& object, Kind kind, Content content) {
  std::uint64_t length = 0;
  if (!readLength(content, length)) return false;
  const std::size_t unitSize = kind == Kind::UTF16String ? 2 : 1;
  if (length > content.left / unitSize) return refuse("a length beyond the objects");
  const auto bytes = bytes_.substr(content.at, length * unitSize);
  if (!mayCopy(bytes.size())) return false;
  object.extent.bytes = bytes.size();
  if (kind == Kind::Data) return finish(object, Value::Bytes(bytes.begin(), bytes.end()));
  if (kind == Kind::ASCIIString) {
    const auto isASCII = [](char c) { return static_cast<unsigned char>(c) < 0x80; };
    if (!std::all_of(bytes.begin(), bytes.end(), isASCII))
      return refuse("a string that is not ASCII as it says");
    return finishText(object, bytes);
  }
  auto text = utf8FromUTF16(bytes, ByteOrder::Big);
  if (!text) return refuse("a string with half a character");
  return finish(object, *std::move(text));
}

bool Reader::openContainer(std::size_t object, bool isDictionary, Content content) {
  std::uint64_t count = 0;
  if (!readLength(content, count)) return false;
  if (count > content.left / referenceSize_ / (isDictionary ? 2 : 1))
    return refuse("a length beyond the objects");
  if (open_.size() == kMaximumDepth) return refuseTooMuch("nested too deep");
  values_ += count;
  if (values_ > limit_.values) return refuseTooMuch("unfolds to too many values");
  objects_[object].state = State::Open;
  open_.push_back({object, isDictionary, content.at, count});
  return true;
}

/// Follows the innermost container's references up to the next container, or finishes it.
bool Reader::step() {
  auto& container = open_.back();
  for (; container.next < container.references(); ++container.next) {
    const auto child = reference(container, container.next);
    if (child >= objects_.size()) return refuse("a reference to no object");
    if (objects_[child].state == State::Open) return refuse("a container inside itself");
    if (objects_[child].state == State::Read) continue;
    if (!enter(child)) return false;
    if (objects_[child].state == State::Open) return true;
  }
  const auto finished = container;
  open_.pop_back();
  return closeContainer(finished);
}

/// Adds up the sizes behind the container's references and checks the limits before anything is copied.
bool Reader::measure(const Container& container) {
  auto& object = objects_[container.object];
  const auto keys = container.references() - container.count;
  for (std::size_t i = 0; i < container.references(); ++i) {
    const auto& child = objects_[reference(container, i)];
    if (i < keys) {
      if (!isString(child)) return refuse("a key that is not a string");
      if (!mayCopy(child.extent.bytes)) return false;
      object.extent.bytes += child.extent.bytes;
    } else {
      object.extent += child.extent;
      object.height = std::max(object.height, child.height);
    }
    if (object.extent.values >= limit_.values || object.extent.bytes > limit_.bytes) {
      return refuseTooMuch("unfolds to too much");
    }
  }
  if (++object.height > kMaximumDepth) return refuseTooMuch("nested too deep");
  return true;
}

bool Reader::closeContainer(const Container& container) {
  if (!measure(container)) return false;
  const auto child = [&](std::size_t index) -> Object& { return objects_[reference(container, index)]; };
  if (container.isDictionary) {
    Value::Dictionary dictionary;
    for (std::size_t i = 0; i < container.count; ++i) {
      auto& key = child(i);
      dictionary.insert_or_assign(dictionary.end(),
                                  key.text.data() != nullptr ? std::string(key.text) : key.value.string(),
                                  valueOf(child(container.count + i)));
    }
    return finish(objects_[container.object], std::move(dictionary));
  }
  Value::Array array;
  array.reserve(container.count);
  for (std::size_t i = 0; i < container.count; ++i) array.push_back(valueOf(child(i)));
  return finish(objects_[container.object], std::move(array));
}

/// Whether the object is this ASCII string. Compares in place, because many objects may refer to the same
/// bytes.
bool Reader::isText(std::uint64_t object, std::string_view text) {
  if (object >= objects_.size()) return false;
  const auto offset = number(table_ + object * offsetSize_, offsetSize_);
  if (offset < kHeader.size() || offset >= table_) return false;
  const auto marker = static_cast<unsigned>(number(offset, 1));
  const auto kind = static_cast<Kind>(marker >> 4U);
  Content content{marker & 0xFU, offset + 1, table_ - offset - 1};
  std::uint64_t length = 0;
  if ((kind != Kind::ASCIIString && kind != Kind::UTF16String) || !readLength(content, length)) return false;
  const std::size_t unitSize = kind == Kind::UTF16String ? 2 : 1;
  if (length != text.size() || length > content.left / unitSize) return false;
  for (std::size_t i = 0; i < text.size(); ++i) {
    if (number(content.at + i * unitSize, unitSize) != static_cast<unsigned char>(text[i])) return false;
  }
  return true;
}

std::optional<Value> Reader::leafOrEmpty(std::uint64_t object) {
  if (object >= objects_.size()) {
    refuse("a reference to no object");
    return std::nullopt;
  }
  auto& found = objects_[object];
  if (found.state == State::Unread && !enter(object)) return std::nullopt;
  if (found.state == State::Read) return valueOf(found);
  const auto container =
      std::ranges::find(open_, object, [](const Container& open) -> std::uint64_t { return open.object; });
  return container->isDictionary ? Value(Value::Dictionary()) : Value(Value::Array());
}

Result<Value> Reader::readTopLevel(EntryKeys keys) {
  if (!readTrailer() || !enter(top_)) return plistError(problem_);
  if (open_.empty()) return valueOf(objects_[top_]);
  const auto top = open_.front();
  if (!top.isDictionary) return Value(Value::Array());
  Value::Dictionary entries;
  for (const auto key : keys) {
    // The last of equal keys wins.
    std::size_t at = top.count;
    while (at > 0 && !isText(reference(top, at - 1), key)) --at;
    if (at == 0) continue;
    auto value = leafOrEmpty(reference(top, top.count + at - 1));
    if (!value) return plistError(problem_);
    entries.emplace(key, *std::move(value));
  }
  return Value(std::move(entries));
}

}  // namespace

Result<Value> readBinaryPropertyList(std::string_view bytes) {
  return Reader(bytes, largestExtentOf(bytes.size())).read();
}

Result<PartialTree> readBinaryPropertyListWithin(const TreeExtent& most, std::string_view bytes,
                                                 EntryKeys keys) {
  const auto largest = largestExtentOf(bytes.size());
  {
    Reader reader(bytes, {std::min<std::uint64_t>(most.values, largest.values),
                          std::min<std::uint64_t>(most.textBytes, largest.bytes)});
    auto whole = reader.read();
    if (whole) return PartialTree{*std::move(whole), true};
    if (!reader.isTooMuch()) return whole.error();
  }
  constexpr std::uint64_t kNoLimit = std::uint64_t{1} << 62U;  // reads the top level only
  auto part = Reader(bytes, {kNoLimit, kNoLimit}).readTopLevel(keys);
  if (!part) return part.error();
  return PartialTree{*std::move(part), false};
}

}  // namespace kvr
