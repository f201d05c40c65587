#pragma once

#include "platform/value/Date.h"
#include "platform/value/Error.h"
#include "platform/value/Value.h"

#include <concepts>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <span>
#include <string>
#include <string_view>
#include <type_traits>
#include <vector>

namespace kvr {

// What `%@` prints: the description of anything that has one, "(null)" for an absent value.

inline std::string describe(const std::string& text) { return text; }
inline std::string describe(std::string_view text) { return std::string(text); }
inline std::string describe(const char* text) { return text == nullptr ? "(null)" : text; }

template <class T>
concept HasDescription = requires(const T& object) {
  { object.description() } -> std::convertible_to<std::string>;
};

template <HasDescription T>
std::string describe(const T& object) {
  return object.description();
}

template <class T>
std::string describe(const std::optional<T>& value);
template <class T>
std::string describe(const std::shared_ptr<T>& object);
template <class T>
std::string describe(const std::vector<T>& list);

template <class T>
std::string describe(const std::optional<T>& value) {
  return value ? describe(*value) : "(null)";
}

template <class T>
std::string describe(const std::shared_ptr<T>& object) {
  return object ? describe(*object) : "(null)";
}

template <class T>
std::string describe(const std::vector<T>& list) {
  std::string text = "(";
  for (const auto& element : list) {
    if (text.size() > 1) text += ", ";
    text += describe(element);
  }
  return text + ")";
}

namespace format_detail {

enum class Kind { Object, Text, Integer, Real };

/// One argument; its description is made only if the line is written.
struct Argument {
  Kind kind;
  const void* object;
  void (*appendTo)(std::string& out, const void* object, std::string_view precision);
};

void appendInteger(std::string& out, long long number);
void appendUnsigned(std::string& out, unsigned long long number);
void appendReal(std::string& out, double number, std::string_view precision);

template <class T>
constexpr Kind kindOf() {
  if constexpr (std::integral<T>)
    return Kind::Integer;
  else if constexpr (std::floating_point<T>)
    return Kind::Real;
  else if constexpr (std::convertible_to<T, std::string_view>)
    return Kind::Text;
  else
    return Kind::Object;
}

template <class T>
Argument argument(const T& value) {
  return {
      kindOf<T>(), &value, [](std::string& out, const void* object, std::string_view precision) {
        const auto& typed = *static_cast<const T*>(object);
        if constexpr (std::floating_point<T>)
          appendReal(out, typed, precision);
        else if constexpr (std::unsigned_integral<T>)
          appendUnsigned(out, typed);
        else if constexpr (std::integral<T>)
          appendInteger(out, typed);
        else if constexpr (std::convertible_to<T, std::string_view> && !std::convertible_to<T, const char*>)
          out += std::string_view(typed);
        else
          out += describe(typed);
      }};
}

template <std::size_t N>
Argument argument(const char (&text)[N]) {
  return {Kind::Text, text, [](std::string& out, const void* object, std::string_view) {
            out += static_cast<const char*>(object);
          }};
}

/// Finds the next placeholder at or after `from`; `end` is one past it. `known` is false for an unknown
/// conversion.
struct Placeholder {
  std::size_t begin;
  std::size_t end;
  bool known;
  bool isPrivate;
  Kind kind;
  std::string_view precision;  ///< such as ".02", empty for none
};

constexpr std::optional<Placeholder> nextPlaceholder(std::string_view text, std::size_t from) {
  const auto begin = text.find('%', from);
  if (begin == std::string_view::npos) return std::nullopt;
  Placeholder found{begin, begin + 1, true, false, Kind::Object, {}};
  std::string_view rest = text.substr(begin + 1);
  if (rest.starts_with("{private}")) {
    found.isPrivate = true;
    rest.remove_prefix(9);
  }
  std::size_t used = 0;
  if (rest.starts_with('.')) {
    used = 1;
    while (used < rest.size() && rest[used] >= '0' && rest[used] <= '9') ++used;
    found.precision = rest.substr(0, used);
  }
  if (used < rest.size() && rest[used] == 'l') ++used;
  const char conversion = used < rest.size() ? rest[used] : '\0';
  switch (conversion) {
    case '@':
      found.kind = Kind::Object;
      break;
    case 's':
      found.kind = Kind::Text;
      break;
    case 'd':
    case 'u':
      found.kind = Kind::Integer;
      break;
    case 'f':
      found.kind = Kind::Real;
      break;
    default:
      found.known = false;
      break;
  }
  found.end = begin + 1 + (found.isPrivate ? 9U : 0U) + used + 1;
  return found;
}

std::string fill(std::string_view text, std::span<const Argument> arguments, bool revealPrivate);

}  // namespace format_detail

/// A message text with placeholders, checked against its arguments' types when it is compiled: `%@` takes
/// anything that has a description, `%s` text, `%d`, `%ld` and `%lu` integers, `%f` (with a precision) reals;
/// `%{private}@` is written as `<private>` unless private values are to be revealed.
template <class... A>
class FormatString {
 public:
  consteval FormatString(const char* text) : text_(text) {  // NOLINT(google-explicit-constructor)
    constexpr format_detail::Kind kKinds[] = {
        format_detail::kindOf<std::remove_cvref_t<std::decay_t<A>>>()..., format_detail::Kind::Object};
    std::size_t count = 0;
    std::size_t at = 0;
    while (const auto placeholder = format_detail::nextPlaceholder(text_, at)) {
      if (!placeholder->known) throw "unknown placeholder";
      if (count == sizeof...(A)) throw "more placeholders than arguments";
      const auto kind = kKinds[count++];
      if (placeholder->kind != format_detail::Kind::Object && placeholder->kind != kind) {
        throw "argument of the wrong kind";
      }
      at = placeholder->end;
    }
    if (count != sizeof...(A)) throw "fewer placeholders than arguments";
  }

  std::string_view text() const { return text_; }

 private:
  std::string_view text_;
};

/// The text with its placeholders filled.
template <class... A>
std::string format(FormatString<std::type_identity_t<A>...> text, const A&... arguments) {
  const format_detail::Argument list[] = {format_detail::argument(arguments)...,
                                          {format_detail::Kind::Object, nullptr, nullptr}};
  return format_detail::fill(text.text(), {list, sizeof...(A)}, true);
}

}  // namespace kvr
