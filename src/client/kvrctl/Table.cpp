#include "client/kvrctl/Table.h"

#include <algorithm>
#include <numeric>

namespace kvr::client {
namespace {

constexpr std::size_t kGap = 2;             // columns between two cells
constexpr std::size_t kLeastForValue = 12;  // columns behind the names of a paragraph

std::size_t total(const std::vector<std::size_t>& widths) {
  const auto shown = static_cast<std::size_t>(std::ranges::count_if(widths, [](auto it) { return it > 0; }));
  return std::accumulate(widths.begin(), widths.end(), shown > 0 ? (shown - 1) * kGap : 0);
}

}  // namespace

bool Table::isEmpty(std::size_t column) const {
  return std::ranges::all_of(rows_, [column](const auto& row) { return row[column].text.empty(); });
}

Table::Widths Table::naturalWidths() const {
  Widths widths;
  for (std::size_t column = 0; column < columns_.size(); ++column) {
    widths.push_back(columnsOf(columns_[column].heading));
    for (const auto& row : rows_) widths[column] = std::max(widths[column], columnsOf(row[column].text));
  }
  return widths;
}

std::size_t Table::nextToGo(const Widths& widths) const {
  std::size_t next = columns_.size();
  int first = 0;
  for (std::size_t column = 0; column < columns_.size(); ++column) {
    if (widths[column] == 0) continue;
    if (isEmpty(column)) return column;
    const int order = columns_[column].goesAs;
    if (order == 0 || (first != 0 && order > first)) continue;
    first = order;
    next = column;
  }
  return next;
}

Table::Widths Table::widthsFor(std::size_t columns) const {
  Widths natural = naturalWidths();
  Widths least = natural;
  for (std::size_t column = 0; column < columns_.size(); ++column) {
    const auto& [heading, fewest, goesAs] = columns_[column];
    if (fewest > 0) least[column] = std::min(natural[column], std::max(fewest, columnsOf(heading)));
  }
  while (total(least) > columns) {
    const std::size_t next = nextToGo(least);
    if (next == columns_.size()) return {};
    natural[next] = least[next] = 0;
  }
  // The widest cells give way first.
  while (total(natural) > columns) {
    std::size_t widest = columns_.size();
    for (std::size_t column = 0; column < columns_.size(); ++column) {
      if (natural[column] == least[column]) continue;
      if (widest == columns_.size() || natural[column] > natural[widest]) widest = column;
    }
    const std::size_t over = total(natural) - columns;
    std::size_t second = least[widest];
    for (std::size_t column = 0; column < columns_.size(); ++column) {
      if (column != widest && natural[column] > least[column]) second = std::max(second, natural[column]);
    }
    const std::size_t step = natural[widest] > second ? natural[widest] - second : 1;
    natural[widest] -= std::min(step, over);
  }
  return natural;
}

std::string Table::lines(const std::vector<Cell>& row, const Widths& widths, const Style& style) const {
  std::vector<std::vector<std::string>> cells;
  std::size_t height = 0;
  for (std::size_t column = 0; column < row.size(); ++column) {
    if (widths[column] > 0) cells.push_back(wrapped(row[column].text, widths[column]));
    if (widths[column] > 0) height = std::max(height, cells.back().size());
  }
  std::string text;
  for (std::size_t number = 0; number < height; ++number) {
    std::string line;
    std::size_t at = 0;     // the column where the line ends
    std::size_t place = 0;  // where the next cell begins
    auto cell = cells.begin();
    for (std::size_t column = 0; column < row.size(); ++column) {
      if (widths[column] == 0) continue;
      const std::string part = number < cell->size() ? (*cell)[number] : "";
      ++cell;
      if (!part.empty()) {
        line += std::string(place - at, ' ') + style.paint(row[column].paint, part);
        at = place + columnsOf(part);
      }
      place += widths[column] + kGap;
    }
    text += line + "\n";
  }
  return text;
}

std::string Table::paragraphs(const Style& style) const {
  std::string text;
  for (const auto& row : rows_) {
    std::vector<std::pair<std::string, Cell>> lines;
    for (std::size_t column = 0; column < row.size(); ++column) {
      if (!row[column].text.empty()) lines.emplace_back(columns_[column].heading, row[column]);
    }
    text += (text.empty() ? "" : "\n") + paragraph(lines, style);
  }
  return text;
}

std::string Table::text(const Style& style) const {
  const Widths widths = widthsFor(style.columns());
  if (widths.empty()) return paragraphs(style);
  std::vector<Cell> headings;
  for (const auto& column : columns_) headings.emplace_back(column.heading);
  std::string text = lines(headings, widths, style);
  for (const auto& row : rows_) text += lines(row, widths, style);
  return text;
}

std::string paragraph(const std::vector<std::pair<std::string, Cell>>& lines, const Style& style) {
  std::size_t indent = 0;
  for (const auto& line : lines) indent = std::max(indent, columnsOf(line.first) + 2);
  const std::size_t room = std::max(style.columns(), indent + kLeastForValue) - indent;
  std::string text;
  for (const auto& [name, value] : lines) {
    std::string start = padded(name + ":", indent);
    for (const auto& line : wrapped(value.text, room)) {
      text += start + style.paint(value.paint, line) + "\n";
      start = std::string(indent, ' ');
    }
  }
  return text;
}

}  // namespace kvr::client
