#pragma once

#include "platform/value/Date.h"

#include <string>
#include <string_view>
#include <vector>

namespace kvr::client {

/// How text is formatted for people: with colours on a terminal that shows them, dates in the user's format
/// and time zone.
class Style {
 public:
  enum Paint { Good, Bad, Notice, Faint };

  /// The style for standard output: coloured when that is a terminal and NO_COLOR is not set.
  static Style ofOutput();
  explicit Style(bool isColoured) : isColoured_(isColoured) {}

  bool isColoured() const { return isColoured_; }
  std::string paint(Paint paint, const std::string& text) const;
  /// The day of a date as the user's locale writes it (`std::setlocale` must have been called).
  static std::string day(Date date);
  /// The day and time of a date as the user's locale writes them.
  static std::string moment(Date date);

 private:
  bool isColoured_;
};

/// Escapes control characters and others that affect the display of the text around them.
std::string printable(std::string_view text);

/// A table whose columns are as wide as their contents. Cells may be coloured.
class Table {
 public:
  explicit Table(std::vector<std::string> headings) : rows_{std::move(headings)} {}
  void add(std::vector<std::string> row) { rows_.push_back(std::move(row)); }
  std::string text() const;

 private:
  std::vector<std::vector<std::string>> rows_;
};

/// How many terminal columns the text takes, colours not counted: one per character.
std::size_t columnsOf(std::string_view text);

}  // namespace kvr::client
