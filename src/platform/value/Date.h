#pragma once

#include <compare>
#include <string>

namespace kvr {

/// A point in time: seconds since 1970-01-01 00:00 UTC, fractions allowed.
/// A double, because warranty dates lie beyond the year 2262 where 64-bit nanoseconds end.
struct Date {
  double secondsSince1970 = 0;

  friend auto operator<=>(const Date&, const Date&) = default;  // NOLINT(modernize-use-nullptr)
  friend Date operator+(Date date, double seconds) { return {date.secondsSince1970 + seconds}; }
  friend Date operator-(Date date, double seconds) { return {date.secondsSince1970 - seconds}; }
  /// Seconds from `right` until `left`; negative when `left` is the earlier one.
  friend double operator-(Date left, Date right) { return left.secondsSince1970 - right.secondsSince1970; }
};

/// A calendar date and time of day in UTC (proleptic Gregorian).
struct CalendarTime {
  long long year;
  int month;  ///< 1 to 12
  int day;    ///< 1 to 31
  int hour;
  int minute;
  int second;

  friend bool operator==(const CalendarTime&, const CalendarTime&) = default;
};

/// Whether a calendar reaches the date: it is finite and within 1e15 s (some 31 million years) of 1970.
bool isInCalendar(Date date);

/// The calendar reading of whole seconds since 1970; fractions are the caller's to drop.
CalendarTime calendarTime(long long secondsSince1970);
/// Seconds since 1970 of a calendar reading. The fields must be in their ranges.
long long secondsSince1970(const CalendarTime& time);

/// "2026-11-24 15:41:46 +0000"; a date that is not in the calendar prints its seconds.
std::string describe(Date date);

}  // namespace kvr
