#include "html/TALDateFormatterFactory.h"

#include <unicode/udat.h>

#include <array>

#include "platform/Assert.h"

namespace {

using Formatter = TALDateFormatterFactory::Formatter;
using Mode = TALDateFormatter::Mode;

constexpr double kMillisInSecond = 1000;

// A longer text is not a date; the bound also suits ICU's 32-bit lengths.
constexpr size_t kMaxDateUnits = 256;

constexpr std::array kDateTimeStyles = {
    u"uuuu'-'MM'-'dd'T'HH':'mm':'ss",
    u"uuuu'-'MM'-'dd'T'HH':'mm':'ssXXX",
    u"uuuu'-'MM'-'dd'T'HH':'mm':'ss'Z'",
};
constexpr std::array kDateTimes = {
    u"y'-'M'-'d'T'HH':'mm':'ssXXX",
    u"y'-'M'-'d'T'HH':'mm':'ss",
    u"y'-'M'-'d'T'HH':'mm':'ss'.'SXXX",
    u"y'-'M'-'d'T'HH':'mm':'ss'.'S",
};
constexpr const char16_t* kDate = u"uuuu'-'MM'-'dd";
constexpr std::array kDates = {u"y'-'M'-'dXXX", u"y'-'M'-'d"};
constexpr std::array kTimeStyles = {u"HH':'mm':'ss", u"HH':'mm':'ssXXX", u"HH':'mm':'ss'Z'"};
constexpr std::array kTimes = {
    u"HH':'mm':'ssXXX",
    u"HH':'mm':'ss",
    u"HH':'mm':'ss'.'SXXX",
    u"HH':'mm':'ss'.'S",
};

template <size_t count>
Formatter ofStyle(const std::array<const char16_t*, count>& patterns, int64_t style) {
  if (style < 0 || style >= static_cast<int64_t>(count)) return nullptr;
  return std::make_unique<TALDateFormatter>(patterns[static_cast<size_t>(style)], Mode::strict);
}

template <size_t count>
std::vector<Formatter> listOf(const std::array<const char16_t*, count>& patterns) {
  std::vector<Formatter> formatters;
  for (const char16_t* pattern : patterns) {
    formatters.push_back(std::make_unique<TALDateFormatter>(pattern, Mode::lenient));
  }
  return formatters;
}

}  // namespace

struct TALDateFormatter::Format {
  explicit Format(UDateFormat* opened) : handle(opened) {}
  ~Format() { udat_close(handle); }
  Format(const Format&) = delete;
  Format& operator=(const Format&) = delete;

  UDateFormat* const handle;
};

namespace {

UDateFormat* openFormat(const char16_t* pattern, Mode mode) {
  UErrorCode status = U_ZERO_ERROR;
  UDateFormat* format =
      udat_open(UDAT_PATTERN, UDAT_PATTERN, "en_US_POSIX", u"UTC", -1, pattern, -1, &status);
  TL_ASSERT(U_SUCCESS(status));
  udat_setLenient(format, mode == Mode::lenient);
  return format;
}

// The quoted text at the end of a pattern.
TLStringView literalEnding(TLStringView pattern) {
  if (!pattern.ends_with(u'\'')) return {};
  pattern.remove_suffix(1);
  return pattern.substr(pattern.rfind(u'\'') + 1);
}

}  // namespace

TALDateFormatter::TALDateFormatter(const char16_t* pattern, Mode mode)
    : _format(std::make_unique<Format>(openFormat(pattern, mode))),
      _ending(mode == Mode::strict ? literalEnding(pattern) : TLStringView()) {}

TALDateFormatter::~TALDateFormatter() = default;

std::optional<double> TALDateFormatter::dateFromString(TLStringView text) const {
  if (text.empty() || text.size() > kMaxDateUnits) return std::nullopt;
  // Even when strict, ICU accepts a text that ends before the last literal of its pattern.
  if (!text.ends_with(_ending)) return std::nullopt;
  const auto length = static_cast<int32_t>(text.size());
  platform::MutexLock lock(_mutex);
  UErrorCode status = U_ZERO_ERROR;
  int32_t position = 0;
  const UDate millis = udat_parse(_format->handle, text.data(), length, &position, &status);
  if (U_FAILURE(status) || position != length) return std::nullopt;
  return millis / kMillisInSecond;
}

TLString TALDateFormatter::stringFromDate(double date) const {
  TLString text(kMaxDateUnits, u'\0');
  platform::MutexLock lock(_mutex);
  UErrorCode status = U_ZERO_ERROR;
  const int32_t length = udat_format(_format->handle, date * kMillisInSecond, text.data(),
                                     static_cast<int32_t>(text.size()), nullptr, &status);
  text.resize(U_SUCCESS(status) ? static_cast<size_t>(length) : 0);
  return text;
}

Formatter TALDateFormatterFactory::newDateTimeFormatterWithTimeZoneStyle(int64_t style) {
  return ofStyle(kDateTimeStyles, style);
}

std::vector<Formatter> TALDateFormatterFactory::newDateTimeFormatters() {
  return listOf(kDateTimes);
}

Formatter TALDateFormatterFactory::newDateFormatter() {
  return std::make_unique<TALDateFormatter>(kDate, Mode::strict);
}

std::vector<Formatter> TALDateFormatterFactory::newDateFormatters() {
  return listOf(kDates);
}

Formatter TALDateFormatterFactory::newTimeFormatterWithTimeZoneStyle(int64_t style) {
  return ofStyle(kTimeStyles, style);
}

std::vector<Formatter> TALDateFormatterFactory::newTimeFormatters() {
  return listOf(kTimes);
}
