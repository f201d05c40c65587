#pragma once

#include "platform/value/Date.h"

#include <cstddef>
#include <limits>
#include <string>
#include <string_view>
#include <vector>

namespace kvr::client {

/// How text is formatted for people: as wide as the terminal, with colours if it shows them, dates in the
/// user's format and time zone (`std::setlocale` must have been called).
class Style {
 public:
  enum Paint { Good, Bad, Notice, Faint, Plain };
  static constexpr std::size_t kUnlimited = std::numeric_limits<std::size_t>::max();

  /// The style for standard output. It is coloured on a terminal that is not dumb, unless NO_COLOR is set.
  /// The width is that of COLUMNS, or of the terminal; without either it is not limited.
  static Style ofOutput();
  explicit Style(bool isColoured, std::size_t columns = kUnlimited)
      : isColoured_(isColoured), columns_(columns) {}

  std::size_t columns() const { return columns_; }
  std::string paint(Paint paint, const std::string& text) const;
  /// The day of a date as the user's locale writes it, with all digits of the year; ISO 8601 if it has no own
  /// way.
  static std::string day(Date date);
  /// The day and the time, to the minute.
  static std::string moment(Date date);
  /// The day and the time, to the second.
  static std::string second(Date date);
  /// A date in the format of `strftime`; "unknown" for one outside the calendar.
  static std::string formatted(Date date, const std::string& format);

 private:
  bool isColoured_;
  std::size_t columns_;
};

/// Whether the terminal of a descriptor can move its cursor and show colours; false if it is no terminal.
bool isCapableTerminal(int descriptor);

/// Escapes control characters and others that affect the display of the text around them.
std::string printable(std::string_view text);

/// What a reader sees as one character: a letter with its accents, an emoji with what is joined to it.
struct Character {
  std::string_view text;
  std::size_t columns;  ///< 0 to 2
};
std::vector<Character> charactersOf(std::string_view text);

/// How many terminal columns the text takes.
std::size_t columnsOf(std::string_view text);

/// The text in lines of at most so many columns (at least 2), broken between words where that is possible. At
/// least one line.
std::vector<std::string> wrapped(std::string_view text, std::size_t columns);

/// The text followed by spaces up to so many columns.
std::string padded(const std::string& text, std::size_t columns);

}  // namespace kvr::client
