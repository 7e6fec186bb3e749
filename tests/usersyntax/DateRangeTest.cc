#include <gtest/gtest.h>
#include <unicode/timezone.h>

#include <cmath>
#include <cstdlib>
#include <ctime>
#include <random>
#include <string>

#include "tests/support/Seed.h"
#include "usersyntax/DateRange.h"

using usersyntax::DateRange;
using usersyntax::periodNamed;
using usersyntax::rangeNamed;
using usersyntax::sizeNamed;

namespace {

class DateRangeTest : public testing::TestWithParam<const char*> {
 protected:
  DateRangeTest() {
    setenv("TZ", GetParam(), 1);
    tzset();
    icu::TimeZone::adoptDefault(icu::TimeZone::createTimeZone(GetParam()));
  }

  // The local date of a time as text.
  static std::string dayOf(double time, const char* format = "%Y-%m-%d") {
    const auto seconds = static_cast<time_t>(time);
    tm parts{};
    localtime_r(&seconds, &parts);
    char text[32];
    strftime(text, sizeof text, format, &parts);
    return text;
  }
};

constexpr double kNow = 1704700800;  // 2024-01-08, a Monday

}  // namespace

INSTANTIATE_TEST_SUITE_P(Zones, DateRangeTest,
                         testing::Values("UTC", "Europe/Berlin", "America/New_York",
                                         "Pacific/Auckland"));

// A time is in a year, month or day exactly if its local date, as text, begins with that name.
TEST_P(DateRangeTest, PeriodsContainTheDatesThatBeginWithTheirNames) {
  std::mt19937 random(testsupport::firstSeed());
  std::uniform_real_distribution<double> times(0, 2e9);
  for (int i = 0; i < 3000; ++i) {
    const double time = std::floor(times(random));
    const double other = i % 2 == 0 ? time + 86400 : std::floor(times(random));
    for (const char* format : {"%Y", "%Y-%m", "%Y-%m-%d"}) {
      const std::string name = dayOf(time, format);
      const auto period = periodNamed(name, kNow);
      ASSERT_TRUE(period) << name;
      EXPECT_TRUE(period->holds(time)) << name << ' ' << time;
      EXPECT_EQ(period->holds(other), dayOf(other, format) == name) << name << ' ' << other;
      const auto open = rangeNamed(name + "..", kNow);
      EXPECT_EQ(open->holds(other), dayOf(other, format) >= name);
      EXPECT_EQ(rangeNamed(".." + name, kNow)->holds(other), dayOf(other, format) <= name);
    }
  }
}

TEST_P(DateRangeTest, DaysCountFromToday) {
  const auto day = [](const char* name, double now = kNow) {
    const auto period = periodNamed(name, now);
    return period ? dayOf(*period->from) + ' ' + dayOf(*period->until - 1) : "none";
  };
  const double noon = kNow + 4 * 3600;  // the same date in all zones but the last
  const bool far = std::string(GetParam()) == "Pacific/Auckland";
  const double now = far ? kNow : noon;
  const std::pair<const char*, const char*> days[] = {
      {"today", "2024-01-08 2024-01-08"},     {"Yesterday", "2024-01-07 2024-01-07"},
      {"3d", "2024-01-05 2024-01-05"},        {"3w", "2023-12-18 2023-12-18"},
      {"1m", "2023-12-08 2023-12-08"},        {"2Y", "2022-01-08 2022-01-08"},
      {"thisweek", "2024-01-08 2024-01-14"},  {"lastweek", "2024-01-01 2024-01-07"},
      {"lastmonth", "2023-12-01 2023-12-31"}, {"thisyear", "2024-01-01 2024-12-31"}};
  for (const auto& [name, range] : days) EXPECT_EQ(day(name, now), range) << name;
  EXPECT_EQ(day("1m", 1711800000), "2024-02-29 2024-02-29");  // March 30
  EXPECT_EQ(rangeNamed("3w..yesterday", now)->from, periodNamed("3w", now)->from);
  EXPECT_EQ(rangeNamed("3w..yesterday", now)->until, periodNamed("today", now)->from);
  EXPECT_EQ(rangeNamed("2010-03..2011", now),
            (DateRange{periodNamed("2010-03", now)->from, periodNamed("2011", now)->until}));
}

TEST_P(DateRangeTest, RejectsInvalidDates) {
  for (const char* text :
       {"", "x", "10", "20100", "0000", "2010-13", "2010-00", "2010-02-29", "2010-04-31", "2010-1-",
        "2010-01-01-01", "-2010", "3", "w", "3x", "99999999d", "3000y", "today2", "2010 "}) {
    EXPECT_FALSE(periodNamed(text, kNow)) << text;
  }
  for (const char* text : {"..", "2011..2010", "2010..x", "x..", "2010..2011..2012"}) {
    EXPECT_FALSE(rangeNamed(text, kNow)) << text;
  }
  EXPECT_TRUE(rangeNamed("2010..2010", kNow));
  EXPECT_EQ(sizeNamed("0"), 0u);
  EXPECT_EQ(sizeNamed("3G"), uint64_t{3} << 30);
  EXPECT_EQ(sizeNamed("8589934592G"), uint64_t{1} << 63);
  for (const char* text : {"", "M", "-1", "5T", "1.5M", "8589934593G", "99999999999999999999"}) {
    EXPECT_FALSE(sizeNamed(text)) << text;
  }
}
