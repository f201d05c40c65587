#include "client/kvrctl/Timeline.h"

#include "platform/names/Names.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <tuple>

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

// The text's columns.
constexpr std::size_t kColumns = 100;  // if the width is not limited
constexpr std::size_t kFewestForLabels = 12;
constexpr std::size_t kMostForLabels = 24;
constexpr std::size_t kFewestForAxis = 8;

std::optional<Date> inCalendar(std::optional<Date> date) {
  return date && isInCalendar(*date) ? date : std::nullopt;
}

constexpr std::array<const char*, 3> kBlocks{"█", "▒", "▓"};
constexpr std::array<Style::Paint, 3> kPaints{Style::Good, Style::Faint, Style::Notice};
constexpr const char* kEnded = "░";

std::size_t indentOf(const Timeline::Row& row) { return row.subject == Timeline::Row::OfPart ? 2 : 0; }

const Cell kNow{"│", Style::Faint};

/// The cells beside each other.
std::string painted(const std::vector<Cell>& cells, const Style& style) {
  std::string text;
  std::string run;  // of one colour
  for (std::size_t at = 0; at < cells.size(); ++at) {
    run += cells[at].text;
    if (at + 1 < cells.size() && cells[at + 1].paint == cells[at].paint) continue;
    text += style.paint(cells[at].paint, run);
    run.clear();
  }
  return text;
}

std::string legend(const Style& style, std::size_t columns) {
  std::vector<std::tuple<const char*, Style::Paint, const char*>> items;
  for (std::size_t kind = 0; kind < kNames.size(); ++kind) {
    items.emplace_back(kBlocks[kind], kPaints[kind], kNames[kind]);
  }
  items.emplace_back(kEnded, Style::Faint, "ended");
  items.emplace_back("◆", Style::Notice, "activity");
  std::string text;
  std::size_t at = 0;
  for (const auto& [symbol, paint, name] : items) {
    const std::size_t width = 2 + columnsOf(name);
    const bool isFirst = at == 0 || at + 3 + width > columns;
    if (at > 0) text += isFirst ? "\n" : "   ";
    at = isFirst ? width : at + 3 + width;
    text += style.paint(paint, symbol) + " " + name;
  }
  return text + "\n";
}

/// When the activity can run; nothing if no run is planned.
std::optional<Date> dateOf(const char* identifier, const std::vector<Activity>& activities) {
  const auto found = std::ranges::find(activities, identifier, &Activity::identifier);
  return found != activities.end() && found->isToCome() ? std::optional(found->date()) : std::nullopt;
}

}  // namespace

std::string Timeline::Row::end() const {
  if (!spans.empty()) return spans.back().until ? Style::day(*spans.back().until) : "no end known";
  return marks.empty() ? note : Style::day(marks.back());
}

Timeline::Timeline(const std::vector<DeviceStatus>& devices, const std::vector<FollowUp>& followUps,
                   const std::vector<Activity>& activities, Date now,
                   const std::optional<std::string>& serialNumber)
    : now_(now), from_(now - kPast), until_(now + kLeastFuture) {
  for (const auto& status : devices) {
    if (!serialNumber || status.device.serialNumber == serialNumber) addDevice(status, followUps, activities);
  }
  for (const auto& activity : activities) {
    if (serialNumber || !activity.isToCome()) continue;
    const Date date = activity.date();
    rows_.push_back({printable(nameOf(activity)), Row::OfAgent, "", false, {}, {date}});
    reach(date);
  }
  until_ = until_ + 0.05 * (until_ - from_);
}

void Timeline::addCoverage(const DeviceStatus& status) {
  Row row{printable(status.device.name.value_or("unnamed")), Row::OfDevice, "not covered"};
  const auto& coverage = status.coverage;
  if (!coverage) {
    row.note = "unknown";
    row.isUnknown = true;
    rows_.push_back(std::move(row));
    return;
  }
  const auto end = inCalendar(coverage->end);
  const bool hasEnded = end && *end <= now_;
  if (coverage->isCovered && hasEnded) row.note = "ended " + Style::day(*end);
  if (hasEnded ? *end > from_ : coverage->isCovered) {
    const auto activated = inCalendar(status.device.activationDate).value_or(from_);
    addSpan(row, CoverageSpan, end && activated >= *end ? std::min(from_, *end - kDay) : activated, end);
    if (!hasEnded) row.note = printable(coverage->label.value_or("covered"));
  }
  rows_.push_back(std::move(row));
}

void Timeline::addDevice(const DeviceStatus& status, const std::vector<FollowUp>& followUps,
                         const std::vector<Activity>& activities) {
  addCoverage(status);
  const auto& coverage = status.coverage;
  if (!coverage || !coverage->isOfferShown) return;
  const auto begin = coverage->offerFrom;
  const auto end = inCalendar(coverage->offerEnd);
  if (!end || *end > from_) addPart("offer", OfferSpan, begin, end);
  const auto post = dateOf(names::kFollowUpPost, activities);
  if (!status.hasFollowUp && !status.isDismissed && begin && post && (!end || *post < *end)) {
    addPart("follow-up, to come", FollowUpSpan, std::max({*begin, *post, now_}), end);
  }
  for (const auto& followUp : followUps) {
    if (!followUp.serialNumber || followUp.serialNumber != status.device.serialNumber) continue;
    addPart("follow-up, shown", FollowUpSpan, now_, inCalendar(followUp.expirationDate));
    const auto change = dateOf(names::kFollowUpRefresh, activities);
    if (change && (!followUp.expirationDate || *change < *followUp.expirationDate)) {
      rows_.back().marks.push_back(*change);
    }
  }
}

void Timeline::addPart(const std::string& label, Kind kind, std::optional<Date> from,
                       std::optional<Date> until) {
  const char* const end = until && *until <= now_ ? "ended " : "until ";
  Row row{label, Row::OfPart, until ? end + Style::day(*until) : "no dates"};
  if (from) addSpan(row, kind, *from, until);
  rows_.push_back(std::move(row));
}

void Timeline::addSpan(Row& row, Kind kind, Date from, std::optional<Date> until) {
  if (until && !(from < *until)) return;
  row.spans.push_back({kind, from, until, until && *until <= now_});
  if (until) reach(kind == CoverageSpan ? std::min(*until, now_ + kFutureForCoverage) : *until);
}

void Timeline::reach(Date date) { until_ = std::max(until_, std::min(date, now_ + kFuture)); }

Value Timeline::tree() const {
  Value::Array rows;
  for (const auto& row : rows_) {
    Value::Array spans;
    for (const auto& [kind, from, until, hasEnded] : row.spans) {
      Value::Dictionary span{{"kind", kNames[kind]}, {"from", from}, {"hasEnded", hasEnded}};
      if (until) span.emplace("until", *until);
      spans.emplace_back(std::move(span));
    }
    Value::Array marks(row.marks.begin(), row.marks.end());
    rows.emplace_back(Value::Dictionary{
        {"label", row.label}, {"note", row.note}, {"spans", std::move(spans)}, {"marks", std::move(marks)}});
  }
  return Value::Dictionary{{"now", now_}, {"from", from_}, {"until", until_}, {"rows", std::move(rows)}};
}

std::size_t Timeline::cellOf(Date date, std::size_t width) const {
  return static_cast<std::size_t>(std::lround(place(date) * static_cast<double>(width - 1)));
}

double Timeline::place(Date date) const {
  const double place = (date - from_) / (until_ - from_);
  return std::isnan(place) ? 0 : std::clamp(place, 0.0, 1.0);
}

std::vector<Cell> Timeline::cells(const Row& row, std::size_t width) const {
  std::vector<Cell> cells(width, row.isUnknown ? Cell("·", Style::Faint) : Cell(" "));
  cells[cellOf(now_, width)] = kNow;
  for (const auto& span : row.spans) {
    const auto paint = span.hasEnded ? Style::Faint : kPaints[span.kind];
    const std::size_t last = span.until ? cellOf(*span.until, width) : width - 1;
    for (std::size_t at = cellOf(span.from, width); at <= last; ++at) {
      cells[at] = {span.hasEnded ? kEnded : kBlocks[span.kind], paint};
    }
    if (isBeyond(span)) cells.back() = {"▶", paint};
  }
  for (const auto& mark : row.marks) cells[cellOf(mark, width)] = {"◆", Style::Notice};
  return cells;
}

std::string Timeline::text(const Style& style) const {
  const std::size_t columns = style.columns() == Style::kUnlimited ? kColumns : style.columns();
  std::size_t labels = 0;
  std::size_t ends = 0;
  for (const auto& row : rows_) {
    labels = std::max(labels, indentOf(row) + columnsOf(row.label));
    ends = std::max(ends, columnsOf(row.end()));
  }
  labels = std::min(labels, std::clamp(columns / 3, kFewestForLabels, kMostForLabels));
  const std::size_t others = labels + 2 + 1 + ends;
  const std::size_t width = std::max(columns, others + kFewestForAxis) - others;

  const std::string now = "now, " + Style::day(now_);
  const std::size_t most = std::max(columns, columnsOf(now)) - columnsOf(now);
  std::string text(std::min(labels + 2 + cellOf(now_, width), most), ' ');
  text += now + "\n";
  for (const auto& row : rows_) {
    std::string rest = "  ";
    rest += painted(cells(row, width), style) + " " + row.end();
    for (const auto& line : wrapped(row.label, labels - indentOf(row))) {
      text += padded(std::string(indentOf(row), ' ') + line, labels);
      text += rest;
      text += '\n';
      rest = std::string(2 + cellOf(now_, width), ' ') + painted({kNow}, style);
    }
  }
  return text + "\n" + legend(style, columns);
}

}  // namespace kvr::client
