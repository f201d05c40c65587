#include "platform/value/Date.h"

#include <cmath>
#include <cstdio>
#include <cstdlib>

namespace kvr {
namespace {

constexpr long long kSecondsPerDay = 86400;
constexpr double kCalendarLimit = 1e15;

/// Days since 1970-01-01 of a proleptic Gregorian date; eras of 400 years keep the arithmetic exact.
long long daysFromCivil(long long year, int month, int day) {
  if (month <= 2) --year;
  const long long era = (year >= 0 ? year : year - 399) / 400;
  const long long yearOfEra = year - era * 400;
  const long long dayOfYear = (153LL * (month + (month > 2 ? -3 : 9)) + 2) / 5 + day - 1;
  const long long dayOfEra = yearOfEra * 365 + yearOfEra / 4 - yearOfEra / 100 + dayOfYear;
  return era * 146097 + dayOfEra - 719468;
}

}  // namespace

bool isInCalendar(Date date) {
  return std::isfinite(date.secondsSince1970) && std::abs(date.secondsSince1970) <= kCalendarLimit;
}

CalendarTime calendarTime(long long seconds) {
  long long days = seconds / kSecondsPerDay;
  long long rest = seconds % kSecondsPerDay;
  if (rest < 0) {
    rest += kSecondsPerDay;
    --days;
  }
  days += 719468;
  const long long era = (days >= 0 ? days : days - 146096) / 146097;
  const long long dayOfEra = days - era * 146097;
  const long long yearOfEra = (dayOfEra - dayOfEra / 1460 + dayOfEra / 36524 - dayOfEra / 146096) / 365;
  const long long dayOfYear = dayOfEra - (365 * yearOfEra + yearOfEra / 4 - yearOfEra / 100);
  const long long shiftedMonth = (5 * dayOfYear + 2) / 153;
  const int day = static_cast<int>(dayOfYear - (153 * shiftedMonth + 2) / 5 + 1);
  const int month = static_cast<int>(shiftedMonth < 10 ? shiftedMonth + 3 : shiftedMonth - 9);
  const long long year = yearOfEra + era * 400 + (month <= 2 ? 1 : 0);
  return {year,
          month,
          day,
          static_cast<int>(rest / 3600),
          static_cast<int>(rest / 60 % 60),
          static_cast<int>(rest % 60)};
}

long long secondsSince1970(const CalendarTime& time) {
  return daysFromCivil(time.year, time.month, time.day) * kSecondsPerDay + time.hour * 3600LL +
         time.minute * 60LL + time.second;
}

std::string describe(Date date) {
  char text[64];
  if (!isInCalendar(date)) {
    std::snprintf(text, sizeof text, "%g s since 1970", date.secondsSince1970);
    return text;
  }
  const auto time = calendarTime(static_cast<long long>(std::floor(date.secondsSince1970)));
  std::snprintf(text, sizeof text, "%s%04lld-%02d-%02d %02d:%02d:%02d +0000", time.year < 0 ? "-" : "",
                std::abs(time.year), time.month, time.day, time.hour, time.minute, time.second);
  return text;
}

}  // namespace kvr
