#pragma once

#include "platform/value/Date.h"

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

namespace kvr {

/// A property-list tree: the common data type of preferences, files, JSON and the bus.
///
/// A `Value` is immutable and cheap to copy: strings, data and containers are shared. It may be read from
/// any number of threads. Text is UTF-8 and may hold NUL. Integers have one representation each: what fits
/// a signed 64-bit integer is `Int`, only what lies above it is `UInt`.
class Value {
 public:
  enum class Kind { Null, Bool, Int, UInt, Real, String, Date, Data, Array, Dictionary };
  using Bytes = std::vector<std::uint8_t>;
  using Array = std::vector<Value>;
  using Dictionary = std::map<std::string, Value, std::less<>>;

  Value() = default;
  // NOLINTBEGIN(google-explicit-constructor): every content of a tree converts to one
  Value(bool value) : state_(value) {}
  Value(int value) : state_(static_cast<std::int64_t>(value)) {}
  Value(unsigned value) : state_(static_cast<std::int64_t>(value)) {}
  Value(long value) : state_(static_cast<std::int64_t>(value)) {}
  Value(long long value) : state_(static_cast<std::int64_t>(value)) {}
  Value(unsigned long value) : Value(static_cast<unsigned long long>(value)) {}
  Value(unsigned long long value);
  Value(double value) : state_(value) {}
  Value(kvr::Date value) : state_(value) {}
  Value(std::string value);
  Value(std::string_view value) : Value(std::string(value)) {}
  Value(const char* value) : Value(std::string(value)) {}
  Value(Bytes value);
  Value(Array value);
  Value(Dictionary value);
  /// A present value, or null.
  template <class T>
  Value(const std::optional<T>& value) : Value(value ? Value(*value) : Value()) {}
  // NOLINTEND(google-explicit-constructor)
  /// Keeps pointers from converting to bool by accident.
  template <class T>
  Value(T*) = delete;

  Kind kind() const { return static_cast<Kind>(state_.index()); }
  bool isNull() const { return kind() == Kind::Null; }
  bool isBool() const { return kind() == Kind::Bool; }
  /// `Int`, `UInt` or `Real`; a bool is not one of them.
  bool isNumber() const { return kind() == Kind::Int || kind() == Kind::UInt || kind() == Kind::Real; }
  bool isString() const { return kind() == Kind::String; }
  bool isDate() const { return kind() == Kind::Date; }
  bool isData() const { return kind() == Kind::Data; }
  bool isArray() const { return kind() == Kind::Array; }
  bool isDictionary() const { return kind() == Kind::Dictionary; }

  // The content of a value of exactly that kind; for any other kind throws std::bad_variant_access.
  bool boolean() const { return std::get<bool>(state_); }
  std::int64_t integer() const { return std::get<std::int64_t>(state_); }
  std::uint64_t unsignedInteger() const { return std::get<std::uint64_t>(state_); }
  double real() const { return std::get<double>(state_); }
  const std::string& string() const { return *std::get<Shared<std::string>>(state_); }
  kvr::Date date() const { return std::get<kvr::Date>(state_); }
  const Bytes& data() const { return *std::get<Shared<Bytes>>(state_); }
  const Array& array() const { return *std::get<Shared<Array>>(state_); }
  const Dictionary& dictionary() const { return *std::get<Shared<Dictionary>>(state_); }

  // The content if the value is of that kind, else nothing.
  std::optional<std::string> stringIfAny() const;
  std::optional<kvr::Date> dateIfAny() const;

  /// The entry under `key`; null when this is no dictionary or has no such entry.
  const Value& operator[](std::string_view key) const;
  /// Whether this is a dictionary with an entry under `key`, a null one included.
  bool contains(std::string_view key) const;

  // Conversions from any kind, with the rules for stored settings.
  /// A number or bool: non-zero. A string: after blanks, signs and zeros, a first character Y, y, T, t or 1
  /// to 9.
  bool asBool() const;
  /// A number or bool as it is, a string by its leading decimal number; anything else 0.
  double asDouble() const;
  /// A number or bool truncated toward zero and saturated, a string by its leading decimal digits; else 0.
  std::int64_t asInteger() const;

  /// Deep equality. Numbers of any kind compare by their exact value. A bool equals only a bool. A NaN equals
  /// a NaN, so that a tree always equals itself.
  friend bool operator==(const Value& left, const Value& right);

 private:
  template <class T>
  using Shared = std::shared_ptr<const T>;
  std::variant<std::monostate, bool, std::int64_t, std::uint64_t, double, Shared<std::string>, kvr::Date,
               Shared<Bytes>, Shared<Array>, Shared<Dictionary>>
      state_;
};

/// The form used in log lines, on one line: `{covered = 1; items = (a, "b c"); }`.
std::string describe(const Value& value);

}  // namespace kvr
