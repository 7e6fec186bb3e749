#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

namespace usersyntax {

// Times from `from` on and before `until`, in seconds since 1970; without one, that end is open.
struct DateRange {
  std::optional<double> from;
  std::optional<double> until;

  [[nodiscard]] bool holds(double time) const {
    return (!from || time >= *from) && (!until || time < *until);
  }
  bool operator==(const DateRange&) const = default;
};

// The period that a text names, in the time zone of the system: a year 2010, a month 2010-03, a day
// 2010-03-15; today, yesterday, thisweek, lastweek (from Monday), thismonth, lastmonth, thisyear,
// lastyear; 3d, 2w, 6m, 1y for the day that lies so far back. None for a text that names none, and
// for days that do not exist.
[[nodiscard]] std::optional<DateRange> periodNamed(std::string_view text, double now);

// A period, or two with ".." between them, of which one may be missing: from the beginning of the
// first to the end of the second. None also where the second ends before the first begins.
[[nodiscard]] std::optional<DateRange> rangeNamed(std::string_view text, double now);

// A number followed by K, M or G, which are powers of 1024; "B" may follow. None for another
// text, and for more than 2^63.
[[nodiscard]] std::optional<uint64_t> sizeNamed(std::string_view text);

}  // namespace usersyntax
