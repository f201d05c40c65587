#pragma once

#include <charconv>
#include <string>
#include <string_view>

namespace kvr {

/// Reads the decimal number at the start of `text` as std::from_chars does, in any locale, except at the ends
/// of the range: a number too close to zero gives a zero of its sign and no error; one that is too large
/// gives std::errc::result_out_of_range and sets `number` to the infinity of its sign.
std::from_chars_result readReal(std::string_view text, double& number);

/// The value of a hexadecimal digit in either case; -1 for any other character.
constexpr int hexadecimalDigit(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  return -1;
}

/// Appends the shortest decimal form that reads back as the same number.
template <class Number>
void appendNumber(std::string& out, Number number) {
  char text[32];
  out.append(text, std::to_chars(text, text + sizeof text, number).ptr);
}

}  // namespace kvr
