#pragma once

#include <cstdint>
#include <optional>

// The proleptic Gregorian calendar, as in ISO 8601. Any thread; nothing may change the environment
// meanwhile.
namespace platform {

// 2001-01-01 00:00:00 UTC in seconds since 1970-01-01; the epoch of times in query conditions.
inline constexpr double kReferenceDate = 978307200;

enum class Zone { system, utc };

struct CalendarFields {
  int32_t year;
  int32_t month;  // from 1
  int32_t day;    // from 1
  int32_t hour;
  int32_t minute;
  int32_t second;

  bool operator==(const CalendarFields&) const = default;
};

// Times are in seconds since 1970-01-01 00:00:00 UTC. Nullopt for a time that is not finite or is
// more than 5,000,000 years away.
[[nodiscard]] std::optional<CalendarFields> fieldsOfTime(double time, Zone zone);

// Fields out of range carry over: day 0 is the last day of the previous month. Nullopt if a field
// is above five million or the result is too far away. A time in the gap of a clock change is moved
// forward by the gap; an ambiguous time is the first of the two.
[[nodiscard]] std::optional<double> timeOfFields(const CalendarFields& fields, Zone zone);

// The day of the week of a time, where 1 is the first day of the week in the current locale; in the
// system's time zone. Nullopt as for fieldsOfTime.
[[nodiscard]] std::optional<int32_t> dayOfWeek(double time);

}  // namespace platform
