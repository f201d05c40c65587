#pragma once

#include "client/kvrctl/Terminal.h"

#include <cstddef>
#include <string>
#include <utility>
#include <vector>

namespace kvr::client {

/// A column of a table. All its lines are as wide as its widest cell, if there is room.
struct Column {
  Column(const char* title, std::size_t columns = 0, int goes = 0)  // NOLINT(google-explicit-constructor)
      : heading(title), least(columns), goesAs(goes) {}

  std::string heading;
  std::size_t least;  ///< to how many columns it may shrink by breaking its lines; 0: it may not
  int goesAs;         ///< if there is no room, columns go in this order from 1; 0: it never goes
};

struct Cell {
  // NOLINTBEGIN(google-explicit-constructor)
  Cell(std::string content, Style::Paint colour = Style::Plain) : text(std::move(content)), paint(colour) {}
  Cell(const char* content) : text(content) {}
  // NOLINTEND(google-explicit-constructor)

  std::string text;  ///< printable
  Style::Paint paint = Style::Plain;
};

/// A table that is never wider than the terminal. If there is no room, empty columns go first, then those
/// that may; if the rest has no room either, each row becomes a paragraph, a line for each cell.
class Table {
 public:
  explicit Table(std::vector<Column> columns) : columns_(std::move(columns)) {}
  void add(std::vector<Cell> row) { rows_.push_back(std::move(row)); }
  std::string text(const Style& style) const;

 private:
  using Widths = std::vector<std::size_t>;  ///< of each column; 0: it is left out

  Widths naturalWidths() const;
  /// The widths for this terminal; none if the table has no room.
  Widths widthsFor(std::size_t columns) const;
  /// Which column goes next; the number of columns if none can.
  std::size_t nextToGo(const Widths& widths) const;
  bool isEmpty(std::size_t column) const;
  std::string lines(const std::vector<Cell>& row, const Widths& widths, const Style& style) const;
  std::string paragraphs(const Style& style) const;

  const std::vector<Column> columns_;
  std::vector<std::vector<Cell>> rows_;
};

/// Lines of a name and a value; long values are broken, and all of their lines begin below each other.
std::string paragraph(const std::vector<std::pair<std::string, Cell>>& lines, const Style& style);

}  // namespace kvr::client
