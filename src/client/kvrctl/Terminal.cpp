#include "client/kvrctl/Terminal.h"

#include "platform/text/UTF8.h"

#include <unistd.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <ctime>

namespace kvr::client {
namespace {

constexpr std::array<const char*, 4> kColours{"\033[32m", "\033[31m", "\033[33m", "\033[2m"};
constexpr const char* kPlain = "\033[0m";
constexpr std::size_t kGap = 2;  // columns between two cells

std::string formatted(Date date, const char* format) {
  if (!isInCalendar(date)) return "unknown";
  const auto time = static_cast<std::time_t>(std::floor(date.secondsSince1970));
  std::tm local{};
  std::array<char, 64> text{};
  if (::localtime_r(&time, &local) == nullptr) return "unknown";
  return printable({text.data(), std::strftime(text.data(), text.size(), format, &local)});
}

/// Control characters, line separators, and characters that reorder text.
bool isUnprintable(char32_t point) {
  return point < 0x20 || (point >= 0x7F && point <= 0x9F) || (point >= 0x2028 && point <= 0x202E) ||
         (point >= 0x2066 && point <= 0x2069) || point == 0x200E || point == 0x200F || point == 0x061C;
}

}  // namespace

std::string printable(std::string_view text) {
  std::string result;
  for (std::size_t at = 0; at < text.size();) {
    const std::size_t begin = at;
    char32_t point = nextCodePoint(text, at);
    if (point == kNoCodePoint) {
      point = 0xFFFD;
      ++at;
    } else if (!isUnprintable(point)) {
      result += text.substr(begin, at - begin);
      continue;
    }
    char escape[16];
    std::snprintf(escape, sizeof escape, "\\u%04x", static_cast<unsigned>(point));
    result += escape;
  }
  return result;
}

Style Style::ofOutput() {
  const char* const refused = std::getenv("NO_COLOR");
  return Style(::isatty(STDOUT_FILENO) == 1 && (refused == nullptr || *refused == '\0'));
}

std::string Style::paint(Paint paint, const std::string& text) const {
  return isColoured_ && !text.empty() ? std::string(kColours[paint]) + text + kPlain : text;
}

std::string Style::day(Date date) { return formatted(date, "%x"); }
std::string Style::moment(Date date) { return formatted(date, "%x %X"); }

std::size_t columnsOf(std::string_view text) {
  std::size_t columns = 0;
  bool isInColour = false;
  for (const char c : text) {
    if (c == '\033') isInColour = true;
    // Continuation bytes of UTF-8 take no column.
    if (!isInColour && (static_cast<unsigned char>(c) & 0xC0U) != 0x80U) ++columns;
    if (c == 'm') isInColour = false;
  }
  return columns;
}

std::string Table::text() const {
  std::vector<std::size_t> widths(rows_.front().size(), 0);
  for (const auto& row : rows_) {
    for (std::size_t column = 0; column < row.size(); ++column) {
      widths[column] = std::max(widths[column], columnsOf(row[column]));
    }
  }
  std::string text;
  for (const auto& row : rows_) {
    std::string line;
    for (std::size_t column = 0; column < row.size(); ++column) {
      line += row[column] + std::string(widths[column] - columnsOf(row[column]) + kGap, ' ');
    }
    text += line.substr(0, line.find_last_not_of(' ') + 1) + "\n";
  }
  return text;
}

}  // namespace kvr::client
