#include <charconv>
#include <cmath>
#include <limits>
#include <string>

#include "platform/Calendar.h"
#include "platform/Clock.h"
#include "platform/Text.h"
#include "querylang/TLQueryAdditions.h"

namespace {

using platform::CalendarFields;
using platform::isDigit;
using platform::isWhiteSpace;
using platform::Zone;

constexpr double kSecondsInDay = 86400;
constexpr double kSecondsInWeek = 7 * kSecondsInDay;

// The decimal number at the start of a text, after white space; 0 if there is none, infinite if it
// is too large.
double leadingNumber(std::string_view text) {
  while (!text.empty() && isWhiteSpace(text.front())) text.remove_prefix(1);
  const bool negative = text.starts_with('-');
  if (negative || text.starts_with('+')) text.remove_prefix(1);
  if (text.starts_with('-')) return 0;
  double value = 0;
  const auto result =
      std::from_chars(text.data(), text.data() + text.size(), value, std::chars_format::fixed);
  if (result.ec == std::errc::result_out_of_range) {
    // A number that is too small is out of range as well; it has only zeros before the point.
    const size_t first = text.find_first_not_of('0');
    value =
        first < text.size() && isDigit(text[first]) ? std::numeric_limits<double>::infinity() : 0;
  }
  return negative ? -value : value;
}

// Truncated and clamped to the range of a field.
int32_t asField(double value) {
  constexpr double kMinField = std::numeric_limits<int32_t>::min();
  constexpr double kMaxField = std::numeric_limits<int32_t>::max();
  return static_cast<int32_t>(std::fmax(kMinField, std::fmin(kMaxField, std::trunc(value))));
}

int32_t added(int32_t field, double delta) {
  return asField(static_cast<double>(field) + std::trunc(delta));
}

bool needsWeekday(int32_t token) {
  return token == sq::kTokenTimeThisWeek || token == sq::kTokenTimeLastWeek;
}

// Moves the fields of a time to the start of the period that the function names. Returns the
// seconds per unit of the delta; 0 if the delta is already in a field.
double moveToStart(int32_t token, double delta, int32_t weekday, CalendarFields& fields) {
  fields.hour = fields.minute = fields.second = 0;
  switch (token) {
    case sq::kTokenTimeYesterday:
      fields.day -= 1;
      return kSecondsInDay;
    case sq::kTokenTimeThisWeek:
      fields.day += 1 - weekday;
      return kSecondsInWeek;
    case sq::kTokenTimeLastWeek:
      fields.day += -6 - weekday;
      return kSecondsInWeek;
    case sq::kTokenTimeThisMonth:
      fields.day = 1;
      fields.month = added(fields.month, delta);
      return 0;
    case sq::kTokenTimeThisYear:
      fields.day = fields.month = 1;
      fields.year = added(fields.year, delta);
      return 0;
    default:
      return kSecondsInDay;
  }
}

// Reads a text by position. After its end it yields bytes that are not digits.
class PlacesReader {
 public:
  explicit PlacesReader(std::string_view text) : _text(text) {}

  [[nodiscard]] bool atEnd() const { return _position >= _text.size(); }
  [[nodiscard]] bool isAt(char c) const { return !atEnd() && _text[_position] == c; }

  // The next byte; NUL at the end.
  char take() { return atEnd() ? '\0' : _text[_position++]; }
  bool takeIf(char c) {
    const bool found = isAt(c);
    if (found) ++_position;
    return found;
  }
  // A number of so many bytes; non-digits count as 0.
  int32_t number(int digits) {
    int32_t value = 0;
    for (int i = 0; i < digits; ++i) {
      const char c = take();
      value = value * 10 + (isDigit(c) ? c - '0' : 0);
    }
    return value;
  }
  void skipWhiteSpace() {
    while (!atEnd() && isWhiteSpace(_text[_position])) ++_position;
  }

 private:
  const std::string_view _text;
  size_t _position = 0;
};

// A byte that is not a colon is skipped, and what would follow a colon is 0.
void readTimeOfDay(PlacesReader& reader, CalendarFields& fields) {
  fields.hour = reader.number(2);
  if (reader.take() != ':') return;
  fields.minute = reader.number(2);
  if (reader.take() == ':') fields.second = reader.number(2);
}

// The seconds to add to a time in `zone`, which is set. If there was no colon between hour and
// minute of the day, the sign has been skipped with that byte; an offset without a sign counts as
// east.
double readOffset(PlacesReader& reader, Zone& zone) {
  if (reader.takeIf('Z')) zone = Zone::utc;
  const bool west = reader.isAt('-');
  if (west || reader.isAt('+')) reader.take();
  if (reader.atEnd()) return 0;
  zone = Zone::utc;
  double offset = reader.number(2) * 3600;
  if (reader.takeIf(':')) offset += reader.number(2) * 60;
  return west ? offset : -offset;
}

}  // namespace

bool evalTimeISO8601(std::string_view text, double* time) {
  PlacesReader reader(text);
  CalendarFields fields{};
  Zone zone = Zone::system;
  double offset = 0;
  if (!reader.atEnd()) fields.year = reader.number(4);
  reader.takeIf('-');
  if (!reader.atEnd()) fields.month = reader.number(2);
  reader.takeIf('-');
  if (!reader.atEnd()) fields.day = reader.number(2);
  const char separator = reader.take();
  if (isWhiteSpace(separator) || separator == 'T' || separator == 'Z') {
    readTimeOfDay(reader, fields);
    reader.skipWhiteSpace();
    if (separator == 'Z') {
      zone = Zone::utc;
    } else if (separator != 'T' || !reader.atEnd()) {
      offset = readOffset(reader, zone);
    }
  }
  const auto composed = platform::timeOfFields(fields, zone);
  if (!composed) return false;
  *time = *composed - platform::kReferenceDate + offset;
  return true;
}

double evalTimeExpressionAt(int32_t token, std::string_view deltaString, double now) {
  if (token == sq::kTokenTimeIso) {
    double time = 0;
    return evalTimeISO8601(deltaString, &time) ? time : 0;
  }
  const double delta = leadingNumber(deltaString);
  if (token == sq::kTokenTimeAbsolute) return delta;
  const double sinceReference = now - platform::kReferenceDate;
  if (token == sq::kTokenTimeNow) return sinceReference + delta;
  auto fields = platform::fieldsOfTime(now, Zone::system);
  const auto weekday = needsWeekday(token) ? platform::dayOfWeek(now) : 1;
  if (!fields || !weekday) {
    TLQueryAdditions::log().error("error decomposing time into components {:f}", sinceReference);
    return 0;
  }
  const double unit = moveToStart(token, delta, *weekday, *fields);
  const auto composed = platform::timeOfFields(*fields, Zone::system);
  if (!composed) {
    TLQueryAdditions::log().error("error composing time from components {}, {}, {}, {}, {}, {}",
                                  fields->year, fields->month, fields->day, fields->hour,
                                  fields->minute, fields->second);
    return 0;
  }
  const double start = *composed - platform::kReferenceDate;
  return unit == 0 ? start : start + delta * unit;
}

double TLQueryAdditions::_evalTimeExpression(int32_t token, std::string_view deltaString) {
  return evalTimeExpressionAt(token, deltaString, platform::secondsSince1970());
}
