#include "platform/value/Value.h"

#include "platform/text/Numbers.h"

#include <algorithm>
#include <charconv>
#include <cmath>
#include <limits>

namespace kvr {
namespace {

constexpr double kTwoTo63 = 9223372036854775808.0;
constexpr double kTwoTo64 = 18446744073709551616.0;

bool equalReals(double left, double right) {
  return left == right || (std::isnan(left) && std::isnan(right));
}

bool equalsReal(const Value& integer, double real) {
  if (std::isnan(real) || real != std::trunc(real)) return false;
  if (integer.kind() == Value::Kind::Int) {
    return real >= -kTwoTo63 && real < kTwoTo63 && static_cast<std::int64_t>(real) == integer.integer();
  }
  return real >= 0 && real < kTwoTo64 && static_cast<std::uint64_t>(real) == integer.unsignedInteger();
}

bool equalNumbers(const Value& left, const Value& right) {
  const bool leftReal = left.kind() == Value::Kind::Real;
  const bool rightReal = right.kind() == Value::Kind::Real;
  if (leftReal && rightReal) return equalReals(left.real(), right.real());
  if (leftReal) return equalsReal(right, left.real());
  if (rightReal) return equalsReal(left, right.real());
  if (left.kind() != right.kind()) return false;
  return left.kind() == Value::Kind::Int ? left.integer() == right.integer()
                                         : left.unsignedInteger() == right.unsignedInteger();
}

std::size_t skip(std::string_view text, std::string_view characters, std::size_t from) {
  const auto at = text.find_first_not_of(characters, from);
  return at == std::string_view::npos ? text.size() : at;
}

bool stringAsBool(std::string_view text) {
  const auto start = skip(text, "+-0", skip(text, " \t\n\r\v\f", 0));
  if (start == text.size()) return false;
  return std::string_view("YyTt123456789").find(text[start]) != std::string_view::npos;
}

/// The text after leading blanks and one plus sign, which from_chars does not take.
std::string_view numberText(std::string_view text) {
  text.remove_prefix(skip(text, " \t\n\r\v\f", 0));
  if (text.size() > 1 && text[0] == '+' && text[1] != '-') text.remove_prefix(1);
  return text;
}

double stringAsDouble(std::string_view text) {
  text = numberText(text);
  const bool negative = text.starts_with('-');
  // Only decimal numbers count: from_chars would read "inf" and "nan" too.
  const auto first = negative ? 1U : 0U;
  if (text.size() <= first || std::string_view("0123456789.").find(text[first]) == std::string_view::npos)
    return 0;
  double number = 0;
  readReal(text, number);
  constexpr double kLargest = std::numeric_limits<double>::max();
  return std::clamp(number, -kLargest, kLargest);
}

std::int64_t stringAsInteger(std::string_view text) {
  text = numberText(text);
  std::int64_t number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (error == std::errc::result_out_of_range) {
    return text.starts_with('-') ? std::numeric_limits<std::int64_t>::min()
                                 : std::numeric_limits<std::int64_t>::max();
  }
  return error == std::errc() ? number : 0;
}

std::int64_t realAsInteger(double real) {
  if (std::isnan(real)) return 0;
  if (real >= kTwoTo63) return std::numeric_limits<std::int64_t>::max();
  if (real < -kTwoTo63) return std::numeric_limits<std::int64_t>::min();
  return static_cast<std::int64_t>(real);
}

bool isPlainWord(std::string_view text) {
  if (text.empty()) return false;
  for (const char c : text) {
    const bool plain = (c >= '0' && c <= '9') || (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') ||
                       c == '_' || c == '.' || c == '/' || c == ':' || c == '-';
    if (!plain) return false;
  }
  return true;
}

void appendQuoted(std::string& out, std::string_view text) {
  if (isPlainWord(text)) {
    out += text;
    return;
  }
  out += '"';
  for (const char c : text) {
    if (c == '"' || c == '\\') out += '\\';
    out += c;
  }
  out += '"';
}

void appendData(std::string& out, const Value::Bytes& bytes) {
  static constexpr char kDigits[] = "0123456789abcdef";
  out += '<';
  for (const auto byte : bytes) {
    out += kDigits[byte >> 4U];
    out += kDigits[byte & 0xFU];
  }
  out += '>';
}

// The recursion is bounded: every reader refuses a tree that is nested deeper than its limit.
void append(std::string& out, const Value& value, bool nested) {
  switch (value.kind()) {
    case Value::Kind::Null:
      out += nested ? "<null>" : "(null)";
      break;
    case Value::Kind::Bool:
      out += value.boolean() ? '1' : '0';
      break;
    case Value::Kind::Int:
      appendNumber(out, value.integer());
      break;
    case Value::Kind::UInt:
      appendNumber(out, value.unsignedInteger());
      break;
    case Value::Kind::Real:
      appendNumber(out, value.real());
      break;
    case Value::Kind::String:
      if (nested) {
        appendQuoted(out, value.string());
      } else {
        out += value.string();
      }
      break;
    case Value::Kind::Date: {
      const auto text = describe(value.date());
      if (nested) {
        appendQuoted(out, text);
      } else {
        out += text;
      }
      break;
    }
    case Value::Kind::Data:
      appendData(out, value.data());
      break;
    case Value::Kind::Array: {
      const char* separator = "";
      out += '(';
      for (const auto& element : value.array()) {
        out += separator;
        append(out, element, true);
        separator = ", ";
      }
      out += ')';
      break;
    }
    case Value::Kind::Dictionary:
      out += '{';
      for (const auto& [key, element] : value.dictionary()) {
        appendQuoted(out, key);
        out += " = ";
        append(out, element, true);
        out += "; ";
      }
      out += '}';
      break;
  }
}

}  // namespace

Value::Value(unsigned long long value) {
  if (value <= static_cast<unsigned long long>(std::numeric_limits<std::int64_t>::max())) {
    state_ = static_cast<std::int64_t>(value);
  } else {
    state_ = static_cast<std::uint64_t>(value);
  }
}

Value::Value(std::string value) : state_(std::make_shared<const std::string>(std::move(value))) {}
Value::Value(Bytes value) : state_(std::make_shared<const Bytes>(std::move(value))) {}
Value::Value(Array value) : state_(std::make_shared<const Array>(std::move(value))) {}
Value::Value(Dictionary value) : state_(std::make_shared<const Dictionary>(std::move(value))) {}

std::optional<std::string> Value::stringIfAny() const {
  if (!isString()) return std::nullopt;
  return string();
}

std::optional<Date> Value::dateIfAny() const {
  if (!isDate()) return std::nullopt;
  return date();
}

const Value& Value::operator[](std::string_view key) const {
  static const Value kNull;
  if (!isDictionary()) return kNull;
  const auto found = dictionary().find(key);
  return found == dictionary().end() ? kNull : found->second;
}

bool Value::contains(std::string_view key) const {
  return isDictionary() && dictionary().find(key) != dictionary().end();
}

bool Value::asBool() const {
  switch (kind()) {
    case Kind::Bool:
      return boolean();
    case Kind::Int:
      return integer() != 0;
    case Kind::UInt:
      return true;
    case Kind::Real:
      return real() != 0;
    case Kind::String:
      return stringAsBool(string());
    default:
      return false;
  }
}

double Value::asDouble() const {
  switch (kind()) {
    case Kind::Bool:
      return boolean() ? 1 : 0;
    case Kind::Int:
      return static_cast<double>(integer());
    case Kind::UInt:
      return static_cast<double>(unsignedInteger());
    case Kind::Real:
      return real();
    case Kind::String:
      return stringAsDouble(string());
    default:
      return 0;
  }
}

std::int64_t Value::asInteger() const {
  switch (kind()) {
    case Kind::Bool:
      return boolean() ? 1 : 0;
    case Kind::Int:
      return integer();
    case Kind::UInt:
      return std::numeric_limits<std::int64_t>::max();
    case Kind::Real:
      return realAsInteger(real());
    case Kind::String:
      return stringAsInteger(string());
    default:
      return 0;
  }
}

bool operator==(const Value& left, const Value& right) {
  if (left.isNumber() && right.isNumber()) return equalNumbers(left, right);
  if (left.kind() != right.kind()) return false;
  switch (left.kind()) {
    case Value::Kind::Bool:
      return left.boolean() == right.boolean();
    case Value::Kind::String:
      return left.string() == right.string();
    case Value::Kind::Date:
      return equalReals(left.date().secondsSince1970, right.date().secondsSince1970);
    case Value::Kind::Data:
      return left.data() == right.data();
    case Value::Kind::Array:
      return &left.array() == &right.array() || left.array() == right.array();
    case Value::Kind::Dictionary:
      return &left.dictionary() == &right.dictionary() || left.dictionary() == right.dictionary();
    default:
      return true;
  }
}

std::string describe(const Value& value) {
  std::string out;
  append(out, value, false);
  return out;
}

}  // namespace kvr
