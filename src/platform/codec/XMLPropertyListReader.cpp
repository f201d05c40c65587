#include "platform/codec/PropertyList.h"
#include "platform/codec/PropertyListLimits.h"
#include "platform/codec/TreeBuilder.h"
#include "platform/codec/XMLPropertyList.h"
#include "platform/text/Base64.h"
#include "platform/text/Numbers.h"

#include <expat.h>

#include <algorithm>
#include <cmath>
#include <exception>
#include <limits>
#include <memory>
#include <new>

namespace kvr {
namespace {

bool isBlank(char c) { return c == ' ' || c == '\t' || c == '\n' || c == '\r'; }

std::string_view trimmed(std::string_view text) {
  while (!text.empty() && isBlank(text.front())) text.remove_prefix(1);
  while (!text.empty() && isBlank(text.back())) text.remove_suffix(1);
  return text;
}

/// Removes one sign from the start of the text. Returns whether it was a minus.
bool takeSign(std::string_view& text) {
  const bool negative = text.starts_with('-');
  if (negative || text.starts_with('+')) text.remove_prefix(1);
  return negative;
}

template <class Number>
bool readWhole(std::string_view text, Number& number, int base) {
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number, base);
  return error == std::errc() && end == text.data() + text.size();
}

std::optional<Value> integerFrom(std::string_view text) {
  const bool negative = takeSign(text);
  const bool hexadecimal = text.starts_with("0x") || text.starts_with("0X");
  if (hexadecimal) text.remove_prefix(2);
  std::uint64_t magnitude = 0;
  if (!readWhole(text, magnitude, hexadecimal ? 16 : 10)) return std::nullopt;
  if (!negative) return Value(magnitude);
  if (magnitude > std::uint64_t{1} << 63U) return std::nullopt;
  return Value(static_cast<std::int64_t>(0 - magnitude));
}

bool equalIgnoringCase(std::string_view text, std::string_view lowerCase) {
  return std::equal(text.begin(), text.end(), lowerCase.begin(), lowerCase.end(), [](char left, char right) {
    return (left >= 'A' && left <= 'Z' ? static_cast<char>(left - 'A' + 'a') : left) == right;
  });
}

std::optional<Value> realFrom(std::string_view text) {
  const double sign = takeSign(text) ? -1 : 1;
  if (equalIgnoringCase(text, "nan")) return Value(std::numeric_limits<double>::quiet_NaN());
  if (equalIgnoringCase(text, "inf") || equalIgnoringCase(text, "infinity")) {
    return Value(sign * std::numeric_limits<double>::infinity());
  }
  if (text.empty() || std::string_view("0123456789.").find(text[0]) == std::string_view::npos)
    return std::nullopt;
  double number = 0;
  const auto [end, error] = readReal(text, number);
  if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return Value(sign * number);
}

/// "YYYY-MM-DDThh:mm:ssZ"; the year may have a minus sign and more digits.
std::optional<Value> dateFrom(std::string_view text) {
  constexpr std::string_view kPattern = "-dd-ddTdd:dd:ddZ";
  constexpr std::size_t kMostYearDigits = 9;
  const bool negative = text.starts_with('-');
  if (negative) text.remove_prefix(1);
  if (text.size() < 4 + kPattern.size() || text.size() > kMostYearDigits + kPattern.size())
    return std::nullopt;
  const auto year = text.substr(0, text.size() - kPattern.size());
  const auto rest = text.substr(year.size());
  const auto isDigit = [](char c) { return c >= '0' && c <= '9'; };
  for (std::size_t i = 0; i < kPattern.size(); ++i) {
    if (kPattern[i] == 'd' ? !isDigit(rest[i]) : rest[i] != kPattern[i]) return std::nullopt;
  }
  const auto pair = [rest](std::size_t at) { return (rest[at] - '0') * 10 + (rest[at + 1] - '0'); };
  CalendarTime time{0, pair(1), pair(4), pair(7), pair(10), pair(13)};
  if (!std::all_of(year.begin(), year.end(), isDigit) || !readWhole(year, time.year, 10)) return std::nullopt;
  if (negative) time.year = -time.year;
  const auto seconds = secondsSince1970(time);
  const Date date{static_cast<double>(seconds)};
  // A day, hour, minute or second out of range gives a different calendar time.
  if (!(calendarTime(seconds) == time) || !isInCalendar(date)) return std::nullopt;
  return Value(date);
}

enum class Element { None, Document, Array, Dictionary, Key, String, Integer, Real, Date, Data, True, False };

Element elementNamed(std::string_view name) {
  if (name == "key") return Element::Key;
  if (name == "string") return Element::String;
  if (name == "integer") return Element::Integer;
  if (name == "dict") return Element::Dictionary;
  if (name == "true") return Element::True;
  if (name == "false") return Element::False;
  if (name == "array") return Element::Array;
  if (name == "real") return Element::Real;
  if (name == "date") return Element::Date;
  if (name == "data") return Element::Data;
  if (name == "plist") return Element::Document;
  return Element::None;
}

/// Feeds a document through Expat, whose handlers build the tree.
///
/// A *leaf* is an element that holds text only. The first problem stops the parser; handlers that Expat still
/// calls afterwards do nothing.
class Reader {
 public:
  explicit Reader(TreeBuilder builder) : builder_(std::move(builder)) {}

  Result<Value> read(std::string_view bytes);

 private:
  template <auto operation, class... A>
  static void call(void* self, A... arguments) noexcept;

  void startElement(const XML_Char* name, const XML_Char** attributes);
  void endElement(const XML_Char* name);
  void characters(const XML_Char* text, int length);
  void startDoctype(const XML_Char* name, const XML_Char* system, const XML_Char* publicName, int hasSubset);
  void skippedEntity(const XML_Char* name, int isParameter);

  void installHandlers();
  std::optional<Value> leafValue();
  void require(bool accepted) {
    if (!accepted) fail(builder_.problem());
  }
  void fail(const char* problem) {
    problem_ = problem;
    XML_StopParser(parser_.get(), XML_FALSE);
  }

  std::unique_ptr<XML_ParserStruct, decltype(&XML_ParserFree)> parser_{XML_ParserCreate(nullptr),
                                                                       XML_ParserFree};
  TreeBuilder builder_;
  bool inDocument_ = false;
  Element leaf_ = Element::None;
  std::string text_;  ///< of the open leaf so far; reused for the next leaf
  const char* problem_ = nullptr;
  bool isOutOfMemory_ = false;
};

Result<Value> Reader::read(std::string_view bytes) {
  if (!parser_) throw std::bad_alloc();
  installHandlers();
  constexpr std::size_t kMostAtOnce = std::size_t{1} << 30U;  // Expat takes an int
  bool ok = true;
  do {
    const auto part = bytes.substr(0, kMostAtOnce);
    bytes.remove_prefix(part.size());
    ok = XML_Parse(parser_.get(), part.data(), static_cast<int>(part.size()), bytes.empty()) == XML_STATUS_OK;
  } while (ok && !bytes.empty());
  if (isOutOfMemory_ || XML_GetErrorCode(parser_.get()) == XML_ERROR_NO_MEMORY) throw std::bad_alloc();
  if (ok && builder_.isComplete()) return builder_.take();
  const char* problem = problem_ != nullptr ? problem_
                        : ok                ? "the document holds no value"
                                            : XML_ErrorString(XML_GetErrorCode(parser_.get()));
  return plistError("line " + std::to_string(XML_GetCurrentLineNumber(parser_.get())) + ": " + problem);
}

/// No exception may pass through Expat.
template <auto operation, class... A>
void Reader::call(void* self, A... arguments) noexcept {
  auto& reader = *static_cast<Reader*>(self);
  if (reader.problem_ != nullptr) return;
  try {
    (reader.*operation)(arguments...);
  } catch (const std::exception&) {
    reader.isOutOfMemory_ = true;
    reader.fail("out of memory");
  }
}

void Reader::installHandlers() {
  auto* const parser = parser_.get();
  XML_SetUserData(parser, this);
  XML_SetElementHandler(parser, call<&Reader::startElement, const XML_Char*, const XML_Char**>,
                        call<&Reader::endElement, const XML_Char*>);
  XML_SetCharacterDataHandler(parser, call<&Reader::characters, const XML_Char*, int>);
  XML_SetStartDoctypeDeclHandler(
      parser, call<&Reader::startDoctype, const XML_Char*, const XML_Char*, const XML_Char*, int>);
  // With an external document type, which is never fetched, Expat assumes that it declares unknown entities.
  XML_SetSkippedEntityHandler(parser, call<&Reader::skippedEntity, const XML_Char*, int>);
}

void Reader::startDoctype(const XML_Char* /*name*/, const XML_Char* /*system*/,
                          const XML_Char* /*publicName*/, int hasSubset) {
  if (hasSubset != 0) fail("a document type may declare nothing");
}

void Reader::skippedEntity(const XML_Char* /*name*/, int /*isParameter*/) { fail("unknown entity"); }

void Reader::startElement(const XML_Char* name, const XML_Char** /*attributes*/) {
  if (leaf_ != Element::None) return fail("an element inside an element that holds text only");
  const auto element = elementNamed(name);
  if (inDocument_ == (element == Element::Document)) return fail("the root, and only the root, is <plist>");
  switch (element) {
    case Element::None:
      return fail("unknown element");
    case Element::Document:
      inDocument_ = true;
      break;
    case Element::Array:
      require(builder_.openArray());
      break;
    case Element::Dictionary:
      require(builder_.openDictionary());
      break;
    default:
      leaf_ = element;
      text_.clear();
  }
}

void Reader::characters(const XML_Char* text, int length) {
  const std::string_view added(text, static_cast<std::size_t>(length));
  if (leaf_ != Element::None) {
    text_ += added;
  } else if (!trimmed(added).empty()) {
    fail("text outside an element that holds text");
  }
}

void Reader::endElement(const XML_Char* /*name*/) {
  if (leaf_ == Element::None) {
    if (builder_.depth() > 0) require(builder_.close());
    return;
  }
  if (leaf_ == Element::Key) {
    require(builder_.setKey(text_));
  } else if (auto value = leafValue()) {
    require(builder_.add(*std::move(value)));
  } else {
    fail("an element whose text is not of its kind");
  }
  leaf_ = Element::None;
}

std::optional<Value> Reader::leafValue() {
  switch (leaf_) {
    case Element::String:
      return Value(text_);
    case Element::Integer:
      return integerFrom(trimmed(text_));
    case Element::Real:
      return realFrom(trimmed(text_));
    case Element::Date:
      return dateFrom(trimmed(text_));
    case Element::Data: {
      auto bytes = base64Decode(text_);
      if (!bytes) return std::nullopt;
      return Value(*std::move(bytes));
    }
    default:
      if (!trimmed(text_).empty()) return std::nullopt;
      return Value(leaf_ == Element::True);
  }
}

}  // namespace

Result<Value> readXMLPropertyList(std::string_view bytes) {
  return readXMLPropertyList(bytes, TreeBuilder(kMaximumValues));
}

Result<Value> readXMLPropertyList(std::string_view bytes, TreeBuilder builder) {
  return Reader(std::move(builder)).read(bytes);
}

}  // namespace kvr
