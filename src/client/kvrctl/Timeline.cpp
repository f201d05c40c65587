#include "client/kvrctl/Timeline.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdio>

namespace kvr::client {
namespace {

constexpr double kDay = 86400;  // seconds
// The length of the axis before and after now. Coverage lasts long, but the agent's activities are near: an
// axis for all of the coverage would leave no room for them, so coverage may extend beyond it.
constexpr double kPast = 60 * kDay;
constexpr double kLeastFuture = 60 * kDay;
constexpr double kFutureForCoverage = 180 * kDay;
constexpr double kFuture = 365 * kDay;

constexpr std::array<const char*, 3> kNames{"coverage", "offer", "follow-up"};

// The dimensions of the SVG picture, in its own units.
constexpr int kWidth = 960;
constexpr int kLeft = 260;
constexpr int kRight = 30;
constexpr int kTop = 64;
constexpr int kRowHeight = 34;
constexpr int kBarHeight = 16;

std::string escaped(const std::string& text) {
  std::string result;
  for (const char c : text) {
    switch (c) {
      case '<':
        result += "&lt;";
        break;
      case '>':
        result += "&gt;";
        break;
      case '&':
        result += "&amp;";
        break;
      case '"':
        result += "&quot;";
        break;
      default:
        result += c;
    }
  }
  return result;
}

/// The beginning of the text, with an ellipsis if the rest does not fit.
std::string fitted(const std::string& text, std::size_t columns) {
  if (columnsOf(text) <= columns) return text + std::string(columns - columnsOf(text), ' ');
  std::string start;
  for (const char c : text) {
    const bool isContinuation = (static_cast<unsigned char>(c) & 0xC0U) == 0x80U;
    if (!isContinuation && columnsOf(start) + 1 >= columns) break;
    start += c;
  }
  return start + "…";
}

template <class... Values>
std::string filled(const char* format, Values... values) {
  std::array<char, 512> text{};
  const int length = std::snprintf(text.data(), text.size(), format, values...);
  return {text.data(), static_cast<std::size_t>(std::clamp(length, 0, static_cast<int>(text.size()) - 1))};
}

/// When the text of the shown follow-ups changes next.
std::optional<Date> nextChange(const std::vector<Activity>& activities) {
  for (const auto& activity : activities) {
    if (activity.identifier.ends_with(".followuprefresh") && activity.isToCome()) return activity.date();
  }
  return std::nullopt;
}

}  // namespace

Timeline::Timeline(const std::vector<DeviceStatus>& devices, const std::vector<FollowUp>& followUps,
                   const std::vector<Activity>& activities, Date now)
    : now_(now), from_(now - kPast), until_(now + kLeastFuture) {
  for (const auto& status : devices) addDevice(status, followUps, nextChange(activities));
  for (const auto& activity : activities) {
    const auto date = activity.dueDate ? activity.dueDate : activity.targetDate;
    if (!date) continue;
    rows_.push_back({printable(activity.identifier.substr(activity.identifier.rfind('.') + 1)), {}, {*date}});
    reach(*date);
  }
  until_ = until_ + 0.05 * (until_ - from_);
}

void Timeline::addDevice(const DeviceStatus& status, const std::vector<FollowUp>& followUps,
                         std::optional<Date> change) {
  const auto& [device, coverage, hasFollowUp, isDismissed, downloaded, ignored] = status;
  const std::string name = printable(device.name.value_or("unnamed"));
  if (coverage && coverage->isCovered) {
    add(name, CoverageSpan, device.activationDate.value_or(from_), coverage->end);
  } else {
    rows_.push_back({name, {}, {}});
  }
  if (!coverage || !coverage->isOfferShown) return;
  add("  offer", OfferSpan, coverage->offerFrom, coverage->offerEnd);
  if (!hasFollowUp && !isDismissed && coverage->offerFrom && coverage->offerEnd > now_) {
    add("  follow-up, to come", FollowUpSpan, std::max(*coverage->offerFrom, now_), coverage->offerEnd);
  }
  for (const auto& followUp : followUps) {
    if (!followUp.serialNumber || followUp.serialNumber != device.serialNumber) continue;
    add("  follow-up, shown", FollowUpSpan, now_, followUp.expirationDate);
    if (change) rows_.back().marks.push_back(*change);
  }
}

void Timeline::add(const std::string& label, Kind kind, std::optional<Date> from, std::optional<Date> until) {
  Row row{label, {}, {}};
  if (from && until && *from < *until) {
    row.spans.push_back({kind, *from, *until});
    reach(kind == CoverageSpan ? std::min(*until, now_ + kFutureForCoverage) : *until);
  }
  rows_.push_back(std::move(row));
}

void Timeline::reach(Date date) { until_ = std::max(until_, std::min(date, now_ + kFuture)); }

Value Timeline::tree() const {
  Value::Array rows;
  for (const auto& row : rows_) {
    Value::Array spans;
    for (const auto& [kind, from, until] : row.spans) {
      spans.emplace_back(Value::Dictionary{{"kind", kNames[kind]}, {"from", from}, {"until", until}});
    }
    Value::Array marks(row.marks.begin(), row.marks.end());
    const std::string label = row.label.substr(std::min(row.label.find_first_not_of(' '), row.label.size()));
    rows.emplace_back(
        Value::Dictionary{{"label", label}, {"spans", std::move(spans)}, {"marks", std::move(marks)}});
  }
  return Value::Dictionary{{"now", now_}, {"from", from_}, {"until", until_}, {"rows", std::move(rows)}};
}

double Timeline::place(Date date) const {
  const double place = (date - from_) / (until_ - from_);
  return std::isnan(place) ? 0 : std::clamp(place, 0.0, 1.0);
}

std::string Timeline::text(const Style& style, std::size_t columns) const {
  std::size_t labels = 0;
  for (const auto& row : rows_) labels = std::max(labels, columnsOf(row.label));
  labels = std::min<std::size_t>(labels, 24);
  const std::size_t width = std::max<std::size_t>(columns, labels + 22) - labels - 2;
  const auto columnOf = [&](Date date) {
    return static_cast<std::size_t>(std::lround(place(date) * static_cast<double>(width - 1)));
  };
  constexpr std::array<Style::Paint, 3> kPaints{Style::Good, Style::Faint, Style::Notice};
  constexpr std::array<const char*, 3> kBlocks{"█", "▒", "▓"};

  std::string text = std::string(labels + 2 + columnOf(now_), ' ') + "now, " + Style::day(now_) + "\n";
  for (const auto& row : rows_) {
    std::vector<std::string> cells(width, " ");
    cells[columnOf(now_)] = style.paint(Style::Faint, "│");
    for (const auto& span : row.spans) {
      for (std::size_t at = columnOf(span.from); at <= columnOf(span.until); ++at) {
        cells[at] = style.paint(kPaints[span.kind], kBlocks[span.kind]);
      }
      if (span.until > until_) cells.back() = style.paint(kPaints[span.kind], "▶");
    }
    for (const auto& mark : row.marks) cells[columnOf(mark)] = style.paint(Style::Notice, "◆");
    text += fitted(row.label, labels) + "  ";
    for (const auto& cell : cells) text += cell;
    if (!row.spans.empty()) text += " " + Style::day(row.spans.back().until);
    if (row.spans.empty() && !row.marks.empty()) text += " " + Style::day(row.marks.back());
    text += "\n";
  }
  text += "\n";
  for (std::size_t kind = 0; kind < kNames.size(); ++kind) {
    text += style.paint(kPaints[kind], kBlocks[kind]) + " " + kNames[kind] + "   ";
  }
  return text + style.paint(Style::Notice, "◆") + " activity\n";
}

std::string Timeline::svg() const {
  const int height = kTop + static_cast<int>(rows_.size()) * kRowHeight + 56;
  const auto x = [this](Date date) { return kLeft + place(date) * (kWidth - kLeft - kRight); };
  std::string svg = filled(
      "<svg xmlns=\"http://www.w3.org/2000/svg\" viewBox=\"0 0 %d %d\" font-family=\"system-ui, sans-serif\" "
      "font-size=\"13\" role=\"img\">\n<title>Coverage and offers</title>\n",
      kWidth, height);
  svg +=
      "<style>\n"
      "  text { fill: #2b303b } .faint { fill: #6b7280 } .grid { stroke: #d5d9e0 } .now { stroke: #c2410c }\n"
      "  .coverage { fill: #2f855a } .offer { fill: #9bb7e8 } .follow-up { fill: #d97706 } .mark { fill: "
      "#6d4bb8 }\n"
      "  .ground { fill: #ffffff }\n"
      "  @media (prefers-color-scheme: dark) {\n"
      "    text { fill: #e6e8ec } .faint { fill: #9aa3b2 } .grid { stroke: #3a404c } .now { stroke: #fb923c "
      "}\n"
      "    .coverage { fill: #48b183 } .offer { fill: #4a6ea8 } .follow-up { fill: #f0a43a } .mark { fill: "
      "#a78bfa }\n"
      "    .ground { fill: #16181d }\n"
      "  }\n"
      "</style>\n";
  svg += filled("<rect class=\"ground\" width=\"%d\" height=\"%d\" rx=\"8\"/>\n", kWidth, height);
  constexpr int kDivisions = 5;
  for (int division = 0; division <= kDivisions; ++division) {
    const Date date = from_ + (until_ - from_) * division / kDivisions;
    svg += filled("<line class=\"grid\" x1=\"%.1f\" x2=\"%.1f\" y1=\"%d\" y2=\"%d\"/>", x(date), x(date),
                  kTop - 8, height - 44);
    svg += filled("<text class=\"faint\" x=\"%.1f\" y=\"%d\" text-anchor=\"middle\">%s</text>\n", x(date),
                  kTop - 16, Style::day(date).c_str());
  }
  int y = kTop;
  for (const auto& row : rows_) {
    const bool isPart = row.label.starts_with("  ");
    svg += filled("<text x=\"%d\" y=\"%d\"%s>", isPart ? 40 : 24, y + kBarHeight - 3,
                  isPart ? " class=\"faint\"" : "");
    svg += escaped(fitted(row.label, 32)) + "</text>";
    for (const auto& span : row.spans) {
      const double left = x(span.from);
      svg += filled("<rect class=\"%s\" x=\"%.1f\" y=\"%d\" width=\"%.1f\" height=\"%d\" rx=\"4\"/>",
                    kNames[span.kind], left, y, std::max(x(span.until) - left, 3.0), kBarHeight);
      if (span.until > until_) {
        svg += filled("<path class=\"%s\" d=\"M%d %d l12 11 l-12 11 z\"/>", kNames[span.kind],
                      kWidth - kRight - 4, y - 3);
      }
    }
    for (const auto& mark : row.marks) {
      svg += filled("<path class=\"mark\" d=\"M%.1f %d l7 8 l-7 8 l-7 -8 z\"/>", x(mark), y);
    }
    svg += "\n";
    y += kRowHeight;
  }
  svg += filled("<line class=\"now\" stroke-width=\"2\" x1=\"%.1f\" x2=\"%.1f\" y1=\"%d\" y2=\"%d\"/>",
                x(now_), x(now_), kTop - 8, height - 44);
  svg += filled("<text x=\"%.1f\" y=\"22\" text-anchor=\"middle\" font-weight=\"600\">now, %s</text>\n",
                x(now_), Style::day(now_).c_str());
  int legend = kLeft;
  for (const auto* name : kNames) {
    svg += filled(
        "<rect class=\"%s\" x=\"%d\" y=\"%d\" width=\"14\" height=\"14\" rx=\"3\"/><text class=\"faint\" "
        "x=\"%d\" "
        "y=\"%d\">%s</text>",
        name, legend, height - 30, legend + 20, height - 18, name);
    legend += 110;
  }
  svg += filled(
      "<path class=\"mark\" d=\"M%d %d l7 7 l-7 7 l-7 -7 z\"/><text class=\"faint\" x=\"%d\" "
      "y=\"%d\">activity"
      "</text>\n</svg>\n",
      legend + 7, height - 30, legend + 20, height - 18);
  return svg;
}

}  // namespace kvr::client
