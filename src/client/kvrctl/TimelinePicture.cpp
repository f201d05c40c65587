#include "client/kvrctl/Timeline.h"
#include "platform/text/UTF8.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <ctime>

namespace kvr::client {
namespace {

using Row = Timeline::Row;
using Span = Timeline::Span;

constexpr std::array<const char*, 3> kClasses{"coverage", "offer", "follow-up"};

// The dimensions, in the picture's own units.
constexpr double kWidth = 960;
constexpr double kMargin = 24;
constexpr double kIndent = 16;  // of a device's parts
constexpr double kLeastForLabels = 120;
constexpr double kMostForLabels = 260;
constexpr double kTop = 80;  // above the rows: now, years, months
constexpr double kBarHeight = 16;
constexpr double kLineHeight = 17;
constexpr double kRowGap = 15;
constexpr double kFontSize = 13;
constexpr double kSmallSize = 11.5;
constexpr double kGap = 6;  // between a bar and its text
constexpr double kLegendHeight = 52;
constexpr std::size_t kMostLines = 3;  // of a label
constexpr double kDay = 86400;

constexpr const char* kStyle =
    "<style>\n"
    "  text { fill: #2b303b; unicode-bidi: plaintext } .small { font-size: 11.5px } .faint { fill: #5b6270 "
    "}\n"
    "  .grid { stroke: #d5d9e0 } .now { stroke: #c2410c }\n"
    "  .coverage { fill: #2f855a } .offer { fill: #9bb7e8 } .follow-up { fill: #d97706 } .mark { fill: "
    "#6d4bb8 }\n"
    "  .ended { fill: none; stroke: #6b7280 } .unknown { fill: none; stroke: #6b7280; stroke-dasharray: 3 4 "
    "}\n"
    "  .inside { fill: #ffffff } .over { fill: #10131a }\n"
    "  .ground { fill: #ffffff } .halo { stroke: #ffffff; stroke-width: 4px; paint-order: stroke }\n"
    "  @media (prefers-color-scheme: dark) {\n"
    "    text { fill: #e6e8ec } .faint { fill: #a3abba } .grid { stroke: #3a404c } .now { stroke: #fb923c }\n"
    "    .coverage { fill: #48b183 } .offer { fill: #7c9fd9 } .follow-up { fill: #f0a43a } .mark { fill: "
    "#a78bfa }\n"
    "    .inside, .over { fill: #10131a } .ended, .unknown { stroke: #9aa3b2 }\n"
    "    .ground { fill: #16181d } .halo { stroke: #16181d }\n"
    "  }\n"
    "</style>\n";

template <class... Values>
std::string filled(const char* format, Values... values) {
  std::array<char, 512> text{};
  const int length = std::snprintf(text.data(), text.size(), format, values...);
  return {text.data(), static_cast<std::size_t>(std::clamp(length, 0, static_cast<int>(text.size()) - 1))};
}

/// The text as XML. Characters that no XML document may hold are replaced.
std::string escaped(std::string_view text) {
  std::string result;
  for (std::size_t at = 0; at < text.size();) {
    const std::size_t begin = at;
    const char32_t point = nextCodePoint(text, at);
    if (point == kNoCodePoint) ++at;
    const bool isControl = point < 0x20 && point != '\t' && point != '\n' && point != '\r';
    if (point == kNoCodePoint || isControl || point == 0xFFFE || point == 0xFFFF) {
      appendUTF8(result, 0xFFFD);
    } else if (point == '<') {
      result += "&lt;";
    } else if (point == '>') {
      result += "&gt;";
    } else if (point == '&') {
      result += "&amp;";
    } else {
      result += text.substr(begin, at - begin);
    }
  }
  return result;
}

/// How wide a text is at most, whatever the font: no reader's font is known here.
double widthOf(std::string_view text, double fontSize = kSmallSize) {
  double width = 0;  // in widths of the letter M, nearly
  for (const auto& [character, columns] : charactersOf(text)) {
    const char first = character.front();
    const bool isNarrow = std::string_view(" !'(),.:;I[]fijlrt|").find(first) != std::string_view::npos;
    const bool isWide = std::string_view("MW@%mw").find(first) != std::string_view::npos;
    const bool isCapital = first >= 'A' && first <= 'Z';
    width += columns == 2 ? 1.05 : isNarrow ? 0.41 : isWide ? 1.0 : isCapital ? 0.76 : 0.645;
  }
  return width * fontSize;
}

/// The text in lines no wider than that; the last one ends with an ellipsis if there is too much.
std::vector<std::string> linesOf(const std::string& text, double width, double fontSize) {
  const auto fits = [&](const std::string& line) { return widthOf(line, fontSize) <= width; };
  std::vector<std::string> lines;
  auto columns = static_cast<std::size_t>(width / fontSize / 0.4);
  do {
    lines = wrapped(text, columns);
  } while (!std::ranges::all_of(lines, fits) && --columns > 2);
  if (lines.size() <= kMostLines) return lines;
  lines.resize(kMostLines);
  lines.back() += "…";
  return lines;
}

std::string textAt(double x, double y, const char* attributes, std::string_view text) {
  return filled("<text x=\"%.1f\" y=\"%.1f\"%s>", x, y, attributes) + escaped(text) + "</text>";
}

/// What the row shows, as a sentence.
std::string sentence(const Row& row) {
  std::string text = row.label + ": " + (row.isUnknown ? "coverage unknown" : row.note);
  for (const auto& [kind, from, until, hasEnded] : row.spans) {
    if (row.subject == Row::OfPart) text = row.label + ": from " + Style::day(from);
    if (row.subject == Row::OfDevice) text += hasEnded ? ", ended" : "";
    text += until ? (row.subject == Row::OfDevice && hasEnded ? " " : " until ") + Style::day(*until)
                  : ", no end known";
  }
  if (row.subject == Row::OfAgent) text = row.label + ": " + row.end();
  return text + ".";
}

/// The first second of the month that lies so many months after the date's one, in local time.
Date monthAfter(Date date, int months) {
  const auto time = static_cast<std::time_t>(date.secondsSince1970);
  std::tm local{};
  ::localtime_r(&time, &local);
  local.tm_mon += months;
  local.tm_mday = 1;
  local.tm_hour = local.tm_min = local.tm_sec = 0;
  local.tm_isdst = -1;
  return {static_cast<double>(std::mktime(&local))};
}

}  // namespace

/// Draws a timeline as SVG.
class TimelinePicture {
 public:
  explicit TimelinePicture(const Timeline& timeline) : timeline_(timeline) {
    double labels = kLeastForLabels;
    for (const auto& row : timeline.rows_) {
      labels = std::max(labels, indentOf(row) + widthOf(row.label, kFontSize));
    }
    labels_ = std::min(labels, kMostForLabels);
    left_ = kMargin + labels_ + kMargin;
  }

  std::string document() {
    std::string rows;
    std::string description;
    double y = kTop;
    for (const auto& row : timeline_.rows_) {
      rows += draw(row, y);
      description += (description.empty() ? "" : " ") + sentence(row);
    }
    bottom_ = y;
    const double height = bottom_ + kLegendHeight;
    std::string svg = filled(
        "<svg xmlns=\"http://www.w3.org/2000/svg\" viewBox=\"0 0 %.0f %.0f\" font-family=\"system-ui, "
        "sans-serif\" "
        "font-size=\"%.0f\" role=\"img\" aria-labelledby=\"coverage-title coverage-description\">\n",
        kWidth, height, kFontSize);
    svg += "<title id=\"coverage-title\">Coverage and offers, " + escaped(Style::day(timeline_.now_)) +
           "</title>\n<desc id=\"coverage-description\">" + escaped(description) + "</desc>\n" + kStyle;
    svg += filled("<rect class=\"ground\" width=\"%.0f\" height=\"%.0f\" rx=\"8\"/>\n", kWidth, height);
    return svg + axis() + nowLine() + rows + legend() + "</svg>\n";
  }

 private:
  static double indentOf(const Row& row) { return row.subject == Row::OfPart ? kIndent : 0; }
  double x(Date date) const { return left_ + timeline_.place(date) * (kWidth - left_ - kMargin); }

  /// Months, the year below the first one and each January, and weeks where there is room.
  std::string axis() const {
    std::string svg;
    const auto& [from, until] = std::pair(timeline_.from_, timeline_.until_);
    const double week = x(from + 7 * kDay) - x(from);
    for (Date monday = firstMonday(); week > 12 && monday < until; monday = monday + 7 * kDay) {
      svg += filled("<line class=\"grid\" x1=\"%.1f\" x2=\"%.1f\" y1=\"%.0f\" y2=\"%.0f\"/>\n", x(monday),
                    x(monday), kTop - 16, kTop - 11);
    }
    double end = 0;  // of the last month's name
    std::string year;
    for (Date month = monthAfter(from, 1); month < until; month = monthAfter(month, 1)) {
      svg += filled("<line class=\"grid\" x1=\"%.1f\" x2=\"%.1f\" y1=\"%.0f\" y2=\"%.1f\"/>\n", x(month),
                    x(month), kTop - 22, bottom_);
      const std::string name = Style::formatted(month, "%b");
      const std::string itsYear = Style::formatted(month, "%Y");
      if (x(month) < end || x(month) + widthOf(name) > kWidth) continue;
      end = x(month) + widthOf(name) + kGap;
      svg += textAt(x(month), kTop - 28, " class=\"small faint\"", name) + "\n";
      if (itsYear != year && x(month) + widthOf(itsYear) < kWidth) {
        svg += textAt(x(month), kTop - 42, " class=\"small\"", itsYear) + "\n";
      }
      year = itsYear;
    }
    return svg;
  }

  Date firstMonday() const {
    const Date month = monthAfter(timeline_.from_, 1);
    const auto time = static_cast<std::time_t>(month.secondsSince1970);
    std::tm local{};
    ::localtime_r(&time, &local);
    Date monday = month + ((8 - local.tm_wday) % 7 - 35) * kDay;
    while (monday < timeline_.from_) monday = monday + 7 * kDay;
    return monday;
  }

  std::string nowLine() const {
    const double at = x(timeline_.now_);
    const std::string text = "now, " + Style::day(timeline_.now_);
    const double half = widthOf(text, kFontSize) / 2;
    return filled("<line class=\"now\" stroke-width=\"2\" x1=\"%.1f\" x2=\"%.1f\" y1=\"24\" y2=\"%.1f\"/>\n",
                  at, at, bottom_) +
           textAt(std::clamp(at, half + kGap, kWidth - half - kGap), 18,
                  " text-anchor=\"middle\" font-weight=\"600\"", text) +
           "\n";
  }

  /// Draws the row at `y` and moves `y` to the next one.
  std::string draw(const Row& row, double& y) const {
    std::string svg = "<g><title>" + escaped(sentence(row)) + "</title>";
    double line = y + kBarHeight - 3;
    for (const auto& text : linesOf(row.label, labels_ - indentOf(row), kFontSize)) {
      svg +=
          textAt(kMargin + indentOf(row), line, row.subject == Row::OfPart ? " class=\"faint\"" : "", text);
      line += kLineHeight;
    }
    if (row.subject == Row::OfDevice) {
      for (const auto& text : linesOf(row.note, labels_, kSmallSize)) {
        svg += textAt(kMargin, line - 1, " class=\"small faint\"", text);
        line += kLineHeight;
      }
    }
    if (row.isUnknown) {
      svg += filled("<rect class=\"unknown\" x=\"%.1f\" y=\"%.1f\" width=\"%.1f\" height=\"%.0f\" rx=\"4\"/>",
                    left_, y, kWidth - left_ - kMargin, kBarHeight);
    }
    for (const auto& span : row.spans) svg += bar(span, y);
    for (const auto& mark : row.marks) {
      svg += filled("<path class=\"mark\" d=\"M%.1f %.1f l7 8 l-7 8 l-7 -8 z\"/>", x(mark), y);
    }
    svg += end(row, y) + "</g>\n";
    y = line - kLineHeight + kRowGap + 3;
    return svg;
  }

  std::string bar(const Span& span, double y) const {
    const double begin = x(span.from);
    const double end = span.until ? x(*span.until) : kWidth - kMargin;
    const char* const name = span.hasEnded ? "ended" : kClasses[span.kind];
    std::string svg =
        filled("<rect class=\"%s\" x=\"%.1f\" y=\"%.1f\" width=\"%.1f\" height=\"%.0f\" rx=\"4\"/>", name,
               begin, y, std::max(end - begin, 3.0), kBarHeight);
    if (timeline_.isBeyond(span)) {
      svg +=
          filled("<path class=\"%s\" d=\"M%.1f %.1f l12 11 l-12 11 z\"/>", name, kWidth - kMargin - 4, y - 3);
    }
    return svg;
  }

  /// The row's last date: behind the bar or the mark if there is room, otherwise inside the bar or before it.
  std::string end(const Row& row, double y) const {
    const double baseline = y + kBarHeight - 4;
    const char* const outside = " class=\"small faint halo\"";
    const std::string text = row.end();
    const double width = widthOf(text);
    if (row.spans.empty() && row.marks.empty()) {
      return row.subject == Row::OfPart ? textAt(left_, baseline, outside, text) : "";
    }
    double begin = kWidth;
    double end = 0;
    for (const auto& span : row.spans) {
      begin = std::min(begin, x(span.from));
      end = std::max(end, timeline_.isBeyond(span) ? kWidth - kMargin : x(*span.until));
    }
    const double bar = end - begin;
    for (const auto& mark : row.marks) {
      begin = std::min(begin, x(mark) - 7);
      end = std::max(end, x(mark) + 7);
    }
    if (end + kGap + width < kWidth - kGap) return textAt(end + kGap, baseline, outside, text);
    if (bar < width + 2 * kGap) return textAt(begin - kGap - width, baseline, outside, text);
    const bool isOnGreen = row.spans.back().kind == Timeline::CoverageSpan;
    return textAt(end - kGap, baseline,
                  isOnGreen ? " class=\"small inside\" text-anchor=\"end\""
                            : " class=\"small over\" text-anchor=\"end\"",
                  text);
  }

  std::string legend() const {
    const double y = bottom_ + 18;
    double at = kMargin;
    std::string svg;
    for (const auto* name : {kClasses[0], kClasses[1], kClasses[2], "ended", "unknown"}) {
      svg += filled("<rect class=\"%s\" x=\"%.1f\" y=\"%.1f\" width=\"14\" height=\"14\" rx=\"3\"/>", name,
                    at, y);
      svg += textAt(at + 20, y + 12, " class=\"faint\"", name) + "\n";
      at += 20 + widthOf(name, kFontSize) + kMargin;
    }
    svg += filled("<path class=\"mark\" d=\"M%.1f %.1f l7 7 l-7 7 l-7 -7 z\"/>", at + 7, y);
    return svg + textAt(at + 20, y + 12, " class=\"faint\"", "activity") + "\n";
  }

  const Timeline& timeline_;
  double labels_ = 0;  ///< the width of the labels
  double left_ = 0;    ///< where the axis begins
  double bottom_ = 0;  ///< where it ends
};

std::string Timeline::svg() const { return TimelinePicture(*this).document(); }

}  // namespace kvr::client
