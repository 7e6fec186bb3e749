#include "platform/Calendar.h"

#include <unicode/gregocal.h>
#include <unicode/timezone.h>

#include <cmath>
#include <limits>
#include <memory>

#include "platform/Locale.h"

namespace platform {

namespace {

constexpr double kMillisInSecond = 1000;
constexpr double kMaxTime = 5e6 * 366 * 86400;  // seconds
constexpr int32_t kMaxField = 5000000;

std::unique_ptr<icu::GregorianCalendar> newCalendar(const icu::Locale& locale) {
  UErrorCode status = U_ZERO_ERROR;
  auto calendar = std::make_unique<icu::GregorianCalendar>(locale, status);
  if (U_FAILURE(status)) return nullptr;
  calendar->setGregorianChange(-std::numeric_limits<double>::infinity(), status);
  calendar->setSkippedWallTimeOption(UCAL_WALLTIME_LAST);
  calendar->setRepeatedWallTimeOption(UCAL_WALLTIME_FIRST);
  return U_SUCCESS(status) ? std::move(calendar) : nullptr;
}

// The calling thread's calendar for this zone; null if ICU has none. Cached, because creating one
// costs more than using it.
icu::GregorianCalendar* calendarIn(Zone zone) {
  thread_local const auto calendar = newCalendar(icu::Locale::getRoot());
  if (calendar != nullptr) {
    calendar->adoptTimeZone(zone == Zone::utc ? icu::TimeZone::getGMT()->clone()
                                              : icu::TimeZone::createDefault());
  }
  return calendar.get();
}

// False for a time that is out of range.
bool setTime(icu::GregorianCalendar& calendar, double time) {
  if (!(std::fabs(time) <= kMaxTime)) return false;
  UErrorCode status = U_ZERO_ERROR;
  calendar.setTime(std::floor(time) * kMillisInSecond, status);
  return U_SUCCESS(status);
}

}  // namespace

std::optional<CalendarFields> fieldsOfTime(double time, Zone zone) {
  icu::GregorianCalendar* const calendar = calendarIn(zone);
  if (calendar == nullptr || !setTime(*calendar, time)) return std::nullopt;
  UErrorCode status = U_ZERO_ERROR;
  const auto get = [&](UCalendarDateFields field) { return calendar->get(field, status); };
  const CalendarFields fields{get(UCAL_EXTENDED_YEAR), get(UCAL_MONTH) + 1, get(UCAL_DATE),
                              get(UCAL_HOUR_OF_DAY),   get(UCAL_MINUTE),    get(UCAL_SECOND)};
  return U_SUCCESS(status) ? std::optional(fields) : std::nullopt;
}

std::optional<double> timeOfFields(const CalendarFields& fields, Zone zone) {
  for (const int32_t field :
       {fields.year, fields.month, fields.day, fields.hour, fields.minute, fields.second}) {
    if (field > kMaxField || field < -kMaxField) return std::nullopt;
  }
  icu::GregorianCalendar* const calendar = calendarIn(zone);
  if (calendar == nullptr) return std::nullopt;
  calendar->clear();
  calendar->set(UCAL_EXTENDED_YEAR, fields.year);
  calendar->set(UCAL_MONTH, fields.month - 1);
  calendar->set(UCAL_DATE, fields.day);
  calendar->set(UCAL_HOUR_OF_DAY, fields.hour);
  calendar->set(UCAL_MINUTE, fields.minute);
  calendar->set(UCAL_SECOND, fields.second);
  UErrorCode status = U_ZERO_ERROR;
  const double millis = calendar->getTime(status);
  if (U_FAILURE(status) || !std::isfinite(millis)) return std::nullopt;
  return millis / kMillisInSecond;
}

std::optional<int32_t> dayOfWeek(double time) {
  constexpr int32_t kDaysInWeek = 7;
  const auto locale = currentLocale();
  const auto calendar =
      newCalendar(locale ? icu::Locale(locale->identifier.c_str()) : icu::Locale::getRoot());
  if (calendar == nullptr || !setTime(*calendar, time)) return std::nullopt;
  UErrorCode status = U_ZERO_ERROR;
  const int32_t day = calendar->get(UCAL_DAY_OF_WEEK, status);
  const int32_t first = calendar->getFirstDayOfWeek(status);
  if (U_FAILURE(status)) return std::nullopt;
  return (day - first + kDaysInWeek) % kDaysInWeek + 1;
}

}  // namespace platform
