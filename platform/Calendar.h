#pragma once

#include <cstdint>
#include <optional>

// The Gregorian calendar, also before its introduction, as ISO 8601 counts. Any thread; nothing may
// change the environment at the same time.
namespace platform {

// Seconds from 1970-01-01 to 2001-01-01 00:00:00 UTC, the day from which conditions count.
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

// Times are in seconds since 1970-01-01 00:00:00 UTC. None for a time that is not finite, or more
// than 5,000,000 years away.
[[nodiscard]] std::optional<CalendarFields> fieldsOfTime(double time, Zone zone);

// Fields out of range carry into the next: day 0 is the last one of the month before. None where a
// field is above five million, or the time would be too far away. A time that the clock leaves out
// is as far behind the gap as it is into it; of one that comes twice the first is meant.
[[nodiscard]] std::optional<double> timeOfFields(const CalendarFields& fields, Zone zone);

// The number of the day of a time in its week, from 1 for the first day of the week in the current
// locale; in the system's time zone. None as for fieldsOfTime.
[[nodiscard]] std::optional<int32_t> dayOfWeek(double time);

}  // namespace platform
