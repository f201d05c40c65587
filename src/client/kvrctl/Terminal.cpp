#include "client/kvrctl/Terminal.h"

#include "platform/text/UTF8.h"

#include <langinfo.h>
#include <locale.h>
#include <sys/ioctl.h>
#include <unistd.h>
#include <wchar.h>

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
constexpr std::size_t kFewestColumns = 20;  // what no terminal is narrower than
constexpr char32_t kJoiner = 0x200D;
constexpr char32_t kAsEmoji = 0xFE0F;

/// Control characters, line separators, and characters that reorder text.
bool isUnprintable(char32_t point) {
  return point < 0x20 || (point >= 0x7F && point <= 0x9F) || (point >= 0x2028 && point <= 0x202E) ||
         (point >= 0x2066 && point <= 0x2069) || point == 0x200E || point == 0x200F || point == 0x061C;
}

/// The C library's table of widths, which belongs to a locale. While this object lives, the thread uses one
/// whose characters are those of Unicode.
class Widths {
 public:
  Widths() : before_(::uselocale(unicode())) {}
  ~Widths() { ::uselocale(before_); }
  Widths(const Widths&) = delete;
  Widths& operator=(const Widths&) = delete;

  static std::size_t of(char32_t point) {
    if (point < 0x7F) return 1;
    const int width = ::wcwidth(static_cast<wchar_t>(point));
    return width < 0 ? 1 : static_cast<std::size_t>(width);
  }

 private:
  static locale_t unicode() {
    static const locale_t locale = ::newlocale(LC_CTYPE_MASK, "C.UTF-8", locale_t{});
    return locale;
  }
  locale_t before_;
};

bool isSkinTone(char32_t point) { return point >= 0x1F3FB && point <= 0x1F3FF; }
/// Two of these letters are a flag.
bool isFlagLetter(char32_t point) { return point >= 0x1F1E6 && point <= 0x1F1FF; }

/// Whether the locale has no own way to write dates.
bool isLocaleNeutral() {
  const std::string_view name = ::setlocale(LC_TIME, nullptr);
  return name == "C" || name == "POSIX" || name.starts_with("C.");
}

std::string dayFormat() {
  if (isLocaleNeutral()) return "%Y-%m-%d";
  std::string format = ::nl_langinfo(D_FMT);
  if (format == "%D") return "%m/%d/%Y";
  for (auto at = format.find("%y"); at != std::string::npos; at = format.find("%y")) format[at + 1] = 'Y';
  return format;
}

/// The format of a time of day, without its seconds.
std::string timeFormat() {
  const std::string_view format = isLocaleNeutral() ? "%T" : ::nl_langinfo(T_FMT);
  const bool hasHalves = format.find("%r") != format.npos || format.find("%p") != format.npos;
  return hasHalves ? "%I:%M %p" : "%H:%M";
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

bool isCapableTerminal(int descriptor) {
  const char* const type = std::getenv("TERM");
  return ::isatty(descriptor) == 1 && type != nullptr && std::string_view(type) != "dumb";
}

Style Style::ofOutput() {
  const char* const refused = std::getenv("NO_COLOR");
  const bool isColoured = isCapableTerminal(STDOUT_FILENO) && (refused == nullptr || *refused == '\0');
  winsize size{};
  const char* const given = std::getenv("COLUMNS");
  std::size_t columns = given == nullptr ? 0 : std::strtoul(given, nullptr, 10);
  if (columns == 0 && ::ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) == 0) columns = size.ws_col;
  return Style(isColoured, columns == 0 ? kUnlimited : std::max(columns, kFewestColumns));
}

std::string Style::paint(Paint paint, const std::string& text) const {
  return isColoured_ && paint != Plain && !text.empty() ? std::string(kColours[paint]) + text + kPlain : text;
}

std::string Style::formatted(Date date, const std::string& format) {
  if (!isInCalendar(date)) return "unknown";
  const auto time = static_cast<std::time_t>(std::floor(date.secondsSince1970));
  std::tm local{};
  std::array<char, 64> text{};
  if (::localtime_r(&time, &local) == nullptr) return "unknown";
  return printable({text.data(), std::strftime(text.data(), text.size(), format.c_str(), &local)});
}

std::string Style::day(Date date) { return formatted(date, dayFormat()); }
std::string Style::moment(Date date) { return formatted(date, dayFormat() + " " + timeFormat()); }
std::string Style::second(Date date) { return formatted(date, dayFormat() + " %T"); }

std::vector<Character> charactersOf(std::string_view text) {
  const Widths widths;
  std::vector<Character> characters;
  std::size_t begin = 0;
  char32_t before = 0;
  bool isWholeFlag = false;
  for (std::size_t at = 0; at < text.size(); begin = at) {
    const char32_t point = nextCodePoint(text, at);
    if (point == kNoCodePoint) ++at;
    const std::size_t width = point == kNoCodePoint ? 1 : Widths::of(point);
    const bool endsFlag = isFlagLetter(point) && isFlagLetter(before) && !isWholeFlag;
    if (!characters.empty() && (width == 0 || before == kJoiner || isSkinTone(point) || endsFlag)) {
      auto& [whole, columns] = characters.back();
      whole = {whole.data(), whole.size() + (at - begin)};
      columns = std::max(columns, point == kAsEmoji || endsFlag ? std::size_t{2} : width);
    } else {
      characters.push_back({text.substr(begin, at - begin), width});
    }
    isWholeFlag = endsFlag;
    before = point;
  }
  return characters;
}

std::size_t columnsOf(std::string_view text) {
  std::size_t columns = 0;
  for (const auto& character : charactersOf(text)) columns += character.columns;
  return columns;
}

std::vector<std::string> wrapped(std::string_view text, std::size_t columns) {
  std::vector<std::string> lines;
  const auto end = [&lines](std::string_view line) {
    lines.emplace_back(line.substr(0, line.find_last_not_of(' ') + 1));
  };
  const char* start = text.data();
  const char* gap = start;  // where the line can end best
  std::size_t width = 0;
  for (const auto& [character, itsColumns] : charactersOf(text)) {
    if (itsColumns == 2) gap = character.data();  // East Asian text breaks anywhere
    if (width + itsColumns > columns && character != " ") {
      const char* const cut = gap > start ? gap : character.data();
      end({start, static_cast<std::size_t>(cut - start)});
      start = cut;
      width = columnsOf({start, static_cast<std::size_t>(character.data() - start)});
    }
    width += itsColumns;
    if (itsColumns == 2 || character == " ") gap = character.data() + character.size();
  }
  end({start, static_cast<std::size_t>(text.data() + text.size() - start)});
  return lines;
}

std::string padded(const std::string& text, std::size_t columns) {
  const std::size_t width = columnsOf(text);
  return text + std::string(columns > width ? columns - width : 0, ' ');
}

}  // namespace kvr::client
