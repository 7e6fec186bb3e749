#include <gtest/gtest.h>

#include "html/TALDateFormatterFactory.h"
#include "platform/Text.h"

using Factory = TALDateFormatterFactory;
using Seconds = std::optional<double>;

namespace {

struct Case {
  TLStringView text;
  std::pair<int, double> result;  // the index of the first formatter that reads it, and the date
};

constexpr std::pair<int, double> kUnread{-1, 0};

std::pair<int, double> firstThatReads(const std::vector<Factory::Formatter>& formatters,
                                      TLStringView text) {
  for (size_t i = 0; i < formatters.size(); ++i) {
    if (const auto date = formatters[i]->dateFromString(text)) return {static_cast<int>(i), *date};
  }
  return kUnread;
}

void expectReads(const std::vector<Factory::Formatter>& formatters,
                 std::initializer_list<Case> cases) {
  for (const Case& each : cases) {
    EXPECT_EQ(firstThatReads(formatters, each.text), each.result) << platform::toUTF8(each.text);
  }
}

}  // namespace

TEST(DateFormatter, ListsTryZonesFirst) {
  const TLString digits(300, u'1');
  expectReads(Factory::newDateTimeFormatters(),
              {{u"2024-3-5T10:20:30+02:00", {0, 1709626830}},
               {u"2024-03-05T10:20:30Z", {0, 1709634030}},
               {u"2024-03-05T10:20:30", {1, 1709634030}},
               {u"2024-03-05T10:20:30.25-01:00", {2, 1709637630.25}},
               {u"2024-3-5T10:20:30.5", {3, 1709634030.5}},
               {u"2024-03-05", kUnread},
               {u"2024-03-05T10:20:30 and more", kUnread},
               {u"soon", kUnread},
               {u"", kUnread},
               {digits, kUnread}});
  expectReads(Factory::newDateFormatters(), {{u"2024-3-5+02:00", {0, 1709589600}},
                                             {u"2024-3-5", {1, 1709596800}},
                                             {u"01:00:01", kUnread}});
  expectReads(Factory::newTimeFormatters(), {{u"01:00:00+01:00", {0, 0}},
                                             {u"01:00:01", {1, 3601}},
                                             {u"01:00:01.5Z", {2, 3601.5}},
                                             {u"01:00:01.5", {3, 3601.5}},
                                             {u"2024-3-5", kUnread}});
}

TEST(DateFormatter, SingleFormattersAreStrictAndWriteTheirPattern) {
  const double date = 1709634030;
  const struct {
    Factory::Formatter formatter;
    TLStringView text;
    double value;
  } cases[] = {
      {Factory::newDateTimeFormatterWithTimeZoneStyle(0), u"2024-03-05T10:20:30", date},
      {Factory::newDateTimeFormatterWithTimeZoneStyle(1), u"2024-03-05T10:20:30Z", date},
      {Factory::newDateTimeFormatterWithTimeZoneStyle(2), u"2024-03-05T10:20:30Z", date},
      {Factory::newDateFormatter(), u"2024-03-05", 1709596800},
      {Factory::newTimeFormatterWithTimeZoneStyle(0), u"10:20:30", 37230},
      {Factory::newTimeFormatterWithTimeZoneStyle(1), u"10:20:30Z", 37230},
      {Factory::newTimeFormatterWithTimeZoneStyle(2), u"10:20:30Z", 37230},
  };
  for (const auto& each : cases) {
    ASSERT_NE(each.formatter, nullptr);
    EXPECT_EQ(each.formatter->stringFromDate(date), each.text);
    EXPECT_EQ(each.formatter->dateFromString(each.text), Seconds(each.value));
    for (const TLStringView bad : {u"2024-13-45", u"2024-03-05T25:00:00Z", u"99:00:00"}) {
      EXPECT_EQ(each.formatter->dateFromString(bad), std::nullopt) << platform::toUTF8(bad);
    }
  }
  for (const TLStringView bad : {u"2024-03-05T10:20:30", u"2024-03-05T10:20:30+00:00"}) {
    EXPECT_EQ(Factory::newDateTimeFormatterWithTimeZoneStyle(2)->dateFromString(bad), std::nullopt);
  }
  EXPECT_EQ(Factory::newTimeFormatterWithTimeZoneStyle(2)->dateFromString(u"10:20:30"),
            std::nullopt);
  for (const int64_t style : {int64_t{-1}, int64_t{3}, INT64_MAX, INT64_MIN}) {
    EXPECT_EQ(Factory::newDateTimeFormatterWithTimeZoneStyle(style), nullptr);
    EXPECT_EQ(Factory::newTimeFormatterWithTimeZoneStyle(style), nullptr);
  }
}
