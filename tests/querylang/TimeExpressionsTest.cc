#include <gtest/gtest.h>
#include <unicode/timezone.h>

#include <cmath>
#include <cstdlib>

#include "platform/Calendar.h"
#include "querylang/TLQueryAdditions.h"
#include "tests/support/LogCapture.h"

namespace {

using platform::CalendarFields;
using platform::kReferenceDate;
using platform::timeOfFields;
using platform::Zone;

constexpr double kDay = 86400;

// A time zone one hour ahead of UTC, two in summer, and a country whose weeks begin on Monday.
class TimeExpressions : public testing::Test {
 protected:
  TimeExpressions() {
    icu::TimeZone::adoptDefault(icu::TimeZone::createTimeZone("Europe/Berlin"));
    setenv("LC_ALL", "de_DE.UTF-8", 1);
  }

  static double local(int year, int month, int day, int hour = 0, int minute = 0, int second = 0) {
    return *timeOfFields({year, month, day, hour, minute, second}, Zone::system) - kReferenceDate;
  }
  static double utc(int year, int month, int day, int hour = 0, int minute = 0, int second = 0) {
    return *timeOfFields({year, month, day, hour, minute, second}, Zone::utc) - kReferenceDate;
  }

  testsupport::LogCapture log;
};

}  // namespace

TEST_F(TimeExpressions, ISO8601IsReadByPosition) {
  const struct {
    const char* text;
    double expected;
  } kCases[] = {
      {"2001-01-01T00:00:00Z", 0},
      {"20010101T00:00:00Z", 0},
      {"2000-01-01T00:00:00Z", -31622400},
      {"2001-01-01", local(2001, 1, 1)},
      {"2001-01-01T03:04:05", local(2001, 1, 1, 3, 4, 5)},
      {"2001-01-01T03:04:05 ", local(2001, 1, 1, 3, 4, 5)},
      {"2001-01-01 03:04:05", local(2001, 1, 1, 3, 4, 5)},
      {"2001-01-01 03:04:05Z", utc(2001, 1, 1, 3, 4, 5)},
      {"2001-01-01Z03:04:05+01:00", utc(2001, 1, 1, 3, 4, 5)},
      {"2001-01-01+01:00", local(2001, 1, 1)},
      {"2001-01-01 00:00:00 +01:00", -3600},
      {"2001-01-01T00:00:00 0130", -3600},
      {"2001-01-01T00:00:00-01:30", 5400},
      {"2001-01-01T00:00:00Z+01", -3600},
      {"2001-01-01T00:00:00-", local(2001, 1, 1)},
      // The byte after the minutes, here the sign, is skipped, so the offset has none.
      {"2001-01-01T00:30-05:00", 1800 - 18000},
      {"2001-01-01T00:30:00-05:00", 1800 + 18000},
      {"2001-01-01T12", local(2001, 1, 1, 12)},
      {"2001-1-1", local(2001, 10, 10)},
      {"2001-13-32T25:61:61Z", utc(2002, 2, 2, 2, 2, 1)},
      {"2001", local(2001, 0, 0)},
      {"20", local(2000, 0, 0)},
      {"", local(0, 0, 0)},
      {"1Z:.T+- ", local(1000, 0, 0)},
  };
  for (const auto& one : kCases) {
    double time = NAN;
    EXPECT_TRUE(evalTimeISO8601(one.text, &time)) << one.text;
    EXPECT_EQ(time, one.expected) << one.text;
  }
}

TEST_F(TimeExpressions, FunctionsAreRelativeToTheGivenTime) {
  // A Wednesday in summer.
  const double now = local(2024, 7, 10, 15, 30, 45) + kReferenceDate + 0.25;
  const struct {
    int32_t token;
    const char* delta;
    double expected;
  } kCases[] = {
      {sq::kTokenTimeNow, "0", now - kReferenceDate},
      {sq::kTokenTimeNow, "-3600.5 ", now - kReferenceDate - 3600.5},
      {sq::kTokenTimeAbsolute, "12.5", 12.5},
      {sq::kTokenTimeAbsolute, "+.5", 0.5},
      {sq::kTokenTimeAbsolute, ":", 0},
      {sq::kTokenTimeAbsolute, "", 0},
      {sq::kTokenTimeAbsolute, "--5", 0},
      {sq::kTokenTimeAbsolute, "1.2.3", 1.2},
      {sq::kTokenTimeToday, "0", local(2024, 7, 10)},
      {sq::kTokenTimeToday, "-7", local(2024, 7, 3)},
      {sq::kTokenTimeYesterday, "1", local(2024, 7, 10)},
      {sq::kTokenTimeThisWeek, "0", local(2024, 7, 8)},
      {sq::kTokenTimeThisWeek, "-1.5", local(2024, 7, 8) - 10.5 * kDay},
      {sq::kTokenTimeLastWeek, "0", local(2024, 7, 1)},
      {sq::kTokenTimeThisMonth, "0", local(2024, 7, 1)},
      {sq::kTokenTimeThisMonth, "-8", local(2023, 11, 1)},
      {sq::kTokenTimeThisMonth, "6.9", local(2025, 1, 1)},
      {sq::kTokenTimeThisYear, "0", local(2024, 1, 1)},
      {sq::kTokenTimeThisYear, "-1", local(2023, 1, 1)},
      {sq::kTokenTimeIso, "2001-01-01T00:00:00Z", 0},
      // Days have 86400 seconds regardless of clock changes; months follow the calendar.
      {sq::kTokenTimeToday, "-200", local(2024, 7, 10) - 200 * kDay},
  };
  for (const auto& one : kCases) {
    EXPECT_EQ(evalTimeExpressionAt(one.token, one.delta, now), one.expected)
        << one.token << " " << one.delta;
  }
  EXPECT_NE(local(2024, 7, 10) - 200 * kDay, local(2023, 12, 23));
  // The first day of the month, and of the week.
  const double monday = local(2024, 4, 1) + kReferenceDate;
  EXPECT_EQ(evalTimeExpressionAt(sq::kTokenTimeYesterday, "0", monday), local(2024, 3, 31));
  EXPECT_EQ(evalTimeExpressionAt(sq::kTokenTimeThisWeek, "0", monday), local(2024, 4, 1));
  EXPECT_EQ(evalTimeExpressionAt(sq::kTokenTimeThisWeek, "0", monday - 1), local(2024, 3, 25));
  setenv("LC_ALL", "en_US.UTF-8", 1);
  EXPECT_EQ(evalTimeExpressionAt(sq::kTokenTimeThisWeek, "0", monday), local(2024, 3, 31));
  EXPECT_EQ(evalTimeExpressionAt(sq::kTokenTimeLastWeek, "0", monday), local(2024, 3, 24));
  EXPECT_TRUE(log.lines().empty());
}

TEST_F(TimeExpressions, InvalidTimesAreTheReferenceDate) {
  const double now = local(2024, 7, 10) + kReferenceDate;
  const std::string many(400, '9');
  EXPECT_EQ(evalTimeExpressionAt(sq::kTokenTimeAbsolute, many, now), INFINITY);
  EXPECT_EQ(evalTimeExpressionAt(sq::kTokenTimeAbsolute, "-" + many, now), -INFINITY);
  EXPECT_EQ(evalTimeExpressionAt(sq::kTokenTimeAbsolute, "0." + std::string(400, '0') + "1", now),
            0);
  EXPECT_EQ(evalTimeExpressionAt(sq::kTokenTimeToday, many, now), INFINITY);
  EXPECT_EQ(evalTimeExpressionAt(sq::kTokenTimeThisYear, many, now), 0);
  EXPECT_EQ(evalTimeExpressionAt(sq::kTokenTimeThisMonth, "-" + many, now), 0);
  EXPECT_EQ(
      log.lines(),
      (std::vector<std::string>{
          "error TLQueryParsing: error composing time from components 2147483647, 1, 1, 0, 0, "
          "0",
          "error TLQueryParsing: error composing time from components 2024, -2147483648, 1, "
          "0, 0, 0"}));
  log.clear();
  EXPECT_EQ(evalTimeExpressionAt(sq::kTokenTimeToday, "0", 1e300), 0);
  EXPECT_TRUE(log.contains("error TLQueryParsing: error decomposing time into components 1000000"));
}

TEST_F(TimeExpressions, TheCalendarCarries) {
  const auto carried = [](CalendarFields fields) {
    return platform::fieldsOfTime(*timeOfFields(fields, Zone::utc), Zone::utc);
  };
  EXPECT_EQ(carried({2024, 3, 0, 0, 0, 0}), (CalendarFields{2024, 2, 29, 0, 0, 0}));
  EXPECT_EQ(carried({2024, 13, 1, 0, 0, -1}), (CalendarFields{2024, 12, 31, 23, 59, 59}));
  EXPECT_EQ(carried({1500, 2, 29, 0, 0, 0}), (CalendarFields{1500, 3, 1, 0, 0, 0}));
  EXPECT_EQ(carried({0, 1, 1, 0, 0, 0}), (CalendarFields{0, 1, 1, 0, 0, 0}));
  // 2:30 does not exist on the last Sunday of March, and occurs twice on that of October.
  EXPECT_EQ(local(2024, 3, 31, 2, 30), utc(2024, 3, 31, 1, 30));
  EXPECT_EQ(local(2024, 10, 27, 2, 30), utc(2024, 10, 27, 0, 30));
}
