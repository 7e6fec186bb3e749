#include "usersyntax/DateRange.h"

#include <algorithm>
#include <charconv>
#include <string>
#include <vector>

#include "platform/Calendar.h"
#include "usersyntax/Names.h"

namespace usersyntax {

namespace {

using platform::CalendarFields;
using platform::Zone;

constexpr int32_t kMaxYear = 9999;
constexpr int32_t kMaxBack = 100000;  // days, weeks, months or years
constexpr int32_t kDaysPerWeek = 7;

std::optional<int32_t> numberOf(std::string_view text, size_t mostDigits) {
  int32_t number = 0;
  if (text.empty() || text.size() > mostDigits) return std::nullopt;
  for (const char c : text) {
    if (c < '0' || c > '9') return std::nullopt;
    number = number * 10 + (c - '0');
  }
  return number;
}

// Midnight of a day; days and months out of range carry over.
std::optional<double> midnight(int32_t year, int32_t month, int32_t day) {
  return platform::timeOfFields({year, month, day, 0, 0, 0}, Zone::system);
}

std::optional<DateRange> between(std::optional<double> from, std::optional<double> until) {
  if (!from || !until) return std::nullopt;
  return DateRange{from, until};
}

std::optional<DateRange> daysFrom(int32_t year, int32_t month, int32_t day, int32_t count) {
  return between(midnight(year, month, day), midnight(year, month, day + count));
}

bool isLeap(int32_t year) {
  return (year % 4 == 0 && year % 100 != 0) || year % 400 == 0;
}

int32_t daysInMonth(int32_t year, int32_t month) {
  constexpr int32_t kDays[] = {31, 28, 31, 30, 31, 30, 31, 31, 30, 31, 30, 31};
  return month == 2 && isLeap(year) ? 29 : kDays[month - 1];
}

// 2010, 2010-3, 2010-03-15
std::optional<DateRange> calendarPeriod(std::string_view text) {
  std::vector<std::string_view> parts;
  for (size_t at = 0; at <= text.size();) {
    const size_t end = std::min(text.find_first_of("-/", at), text.size());
    parts.push_back(text.substr(at, end - at));
    at = end + 1;
  }
  if (parts.size() > 3 || parts[0].size() != 4) return std::nullopt;
  const auto year = numberOf(parts[0], 4);
  if (!year || *year < 1 || *year > kMaxYear) return std::nullopt;
  if (parts.size() == 1) return between(midnight(*year, 1, 1), midnight(*year + 1, 1, 1));
  const auto month = numberOf(parts[1], 2);
  if (!month || *month < 1 || *month > 12) return std::nullopt;
  if (parts.size() == 2) return between(midnight(*year, *month, 1), midnight(*year, *month + 1, 1));
  const auto day = numberOf(parts[2], 2);
  if (!day || *day < 1 || *day > daysInMonth(*year, *month)) return std::nullopt;
  return daysFrom(*year, *month, *day, 1);
}

// 3d, 2w, 6m, 1y
std::optional<DateRange> dayBack(std::string_view text, const CalendarFields& today) {
  if (text.size() < 2) return std::nullopt;
  const auto count = numberOf(text.substr(0, text.size() - 1), 6);
  if (!count || *count > kMaxBack) return std::nullopt;
  const int32_t months = text.back() == 'm' ? *count : text.back() == 'y' ? *count * 12 : 0;
  if (months > kMaxYear * 12) return std::nullopt;
  switch (text.back()) {
    case 'd':
      return daysFrom(today.year, today.month, today.day - *count, 1);
    case 'w':
      return daysFrom(today.year, today.month, today.day - *count * kDaysPerWeek, 1);
    case 'm':
    case 'y': {
      // If the month has no such day, its last day.
      const int32_t index = today.year * 12 + today.month - 1 - months;
      if (index < 12) return std::nullopt;
      const int32_t year = index / 12;
      const int32_t month = index % 12 + 1;
      return daysFrom(year, month, std::min(today.day, daysInMonth(year, month)), 1);
    }
    default:
      return std::nullopt;
  }
}

// Days since the last Monday.
int32_t daysIntoWeek(const CalendarFields& day) {
  const auto noon = platform::timeOfFields({day.year, day.month, day.day, 12, 0, 0}, Zone::utc);
  // 1970-01-01 was a Thursday.
  const auto days = static_cast<int64_t>(noon.value_or(0) / 86400.0);
  return static_cast<int32_t>(((days + 3) % kDaysPerWeek + kDaysPerWeek) % kDaysPerWeek);
}

std::optional<DateRange> namedPeriod(const std::string& name, const CalendarFields& today) {
  const auto [year, month, day, hour, minute, second] = today;
  const int32_t monday = day - daysIntoWeek(today);
  if (name == "today" || name == "heute" || name == "hoy") return daysFrom(year, month, day, 1);
  if (name == "yesterday" || name == "gestern" || name == "hier" || name == "ayer") {
    return daysFrom(year, month, day - 1, 1);
  }
  if (name == "thisweek") return daysFrom(year, month, monday, kDaysPerWeek);
  if (name == "lastweek") return daysFrom(year, month, monday - kDaysPerWeek, kDaysPerWeek);
  if (name == "thismonth") return between(midnight(year, month, 1), midnight(year, month + 1, 1));
  if (name == "lastmonth") return between(midnight(year, month - 1, 1), midnight(year, month, 1));
  if (name == "thisyear") return between(midnight(year, 1, 1), midnight(year + 1, 1, 1));
  if (name == "lastyear") return between(midnight(year - 1, 1, 1), midnight(year, 1, 1));
  return std::nullopt;
}

}  // namespace

std::optional<DateRange> periodNamed(std::string_view text, double now) {
  if (auto period = calendarPeriod(text)) return period;
  const auto today = platform::fieldsOfTime(now, Zone::system);
  if (!today) return std::nullopt;
  const std::string name = folded(text);
  if (auto period = namedPeriod(name, *today)) return period;
  return dayBack(name, *today);
}

std::optional<DateRange> rangeNamed(std::string_view text, double now) {
  const size_t dots = text.find("..");
  if (dots == std::string_view::npos) return periodNamed(text, now);
  const std::string_view first = text.substr(0, dots);
  const std::string_view second = text.substr(dots + 2);
  DateRange range;
  if (!first.empty()) {
    const auto period = periodNamed(first, now);
    if (!period) return std::nullopt;
    range.from = period->from;
  }
  if (!second.empty()) {
    const auto period = periodNamed(second, now);
    if (!period) return std::nullopt;
    range.until = period->until;
  }
  const bool empty = range.from && range.until && *range.until <= *range.from;
  if ((first.empty() && second.empty()) || empty) return std::nullopt;
  return range;
}

std::optional<uint64_t> sizeNamed(std::string_view text) {
  uint64_t number = 0;
  const auto [end, failure] = std::from_chars(text.data(), text.data() + text.size(), number);
  if (failure != std::errc()) return std::nullopt;
  std::string unit = folded(text.substr(static_cast<size_t>(end - text.data())));
  if (unit.size() == 2 && unit[1] == 'b') unit.pop_back();
  unsigned shift = 0;
  if (unit == "k") {
    shift = 10;
  } else if (unit == "m") {
    shift = 20;
  } else if (unit == "g") {
    shift = 30;
  } else if (!unit.empty() && unit != "b") {
    return std::nullopt;
  }
  if (number > (uint64_t{1} << 63) >> shift) return std::nullopt;
  return number << shift;
}

}  // namespace usersyntax
