#pragma once

#include "platform/value/Date.h"

#include <string>
#include <string_view>
#include <vector>

namespace kvr::client {

/// How text looks to a person: with colours on a terminal that shows them, dates in the user's own form and
/// zone.
class Style {
 public:
  enum Paint { Good, Bad, Notice, Faint };

  /// For standard output: coloured when that is a terminal and NO_COLOR is not set.
  static Style ofOutput();
  explicit Style(bool isColoured) : isColoured_(isColoured) {}

  bool isColoured() const { return isColoured_; }
  std::string paint(Paint paint, const std::string& text) const;
  /// A date's day as the user's locale writes it (`std::setlocale` must have been called).
  static std::string day(Date date);
  /// Its day and time of day, likewise.
  static std::string moment(Date date);

 private:
  bool isColoured_;
};

/// The text with control characters, and others that change how their surroundings look, as escapes.
std::string printable(std::string_view text);

/// Columns as wide as what stands in them. Text may be coloured.
class Table {
 public:
  explicit Table(std::vector<std::string> headings) : rows_{std::move(headings)} {}
  void add(std::vector<std::string> row) { rows_.push_back(std::move(row)); }
  std::string text() const;

 private:
  std::vector<std::vector<std::string>> rows_;
};

/// How many columns a terminal needs for it, colours aside: one a character.
std::size_t columnsOf(std::string_view text);

}  // namespace kvr::client
