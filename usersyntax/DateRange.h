#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

namespace usersyntax {

// Times from `from` (inclusive) to `until` (exclusive), in seconds since 1970; an end without a
// value is open.
struct DateRange {
  std::optional<double> from;
  std::optional<double> until;

  [[nodiscard]] bool holds(double time) const {
    return (!from || time >= *from) && (!until || time < *until);
  }
  bool operator==(const DateRange&) const = default;
};

// The period that a text names, in the system's time zone: a year 2010, a month 2010-03, a day
// 2010-03-15; today, yesterday, thisweek, lastweek (from Monday), thismonth, lastmonth, thisyear,
// lastyear; or 3d, 2w, 6m, 1y for the day that long ago. Nullopt for any other text, and for days
// that do not exist.
[[nodiscard]] std::optional<DateRange> periodNamed(std::string_view text, double now);

// One period, or two joined by "..", of which one may be missing: from the start of the first to
// the end of the second. Also nullopt if the second ends before the first begins.
[[nodiscard]] std::optional<DateRange> rangeNamed(std::string_view text, double now);

// A number followed by K, M or G, powers of 1024, and optionally by "B". Nullopt for any other
// text, and above 2^63.
[[nodiscard]] std::optional<uint64_t> sizeNamed(std::string_view text);

}  // namespace usersyntax
