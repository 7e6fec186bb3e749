#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/Mutex.h"
#include "platform/Text.h"

// Reads and writes dates with one ICU pattern, in the locale en_US_POSIX and UTC. A date is seconds
// since 1970-01-01 00:00:00 UTC; fields missing in the pattern are taken from the current time. Any
// thread; calls are serialised.
class TALDateFormatter {
 public:
  enum class Mode { strict, lenient };

  // `pattern` must outlive this object.
  TALDateFormatter(const char16_t* pattern, Mode mode);
  ~TALDateFormatter();
  TALDateFormatter(const TALDateFormatter&) = delete;
  TALDateFormatter& operator=(const TALDateFormatter&) = delete;

  // Nullopt unless the whole text is a date in the pattern.
  [[nodiscard]] std::optional<double> dateFromString(TLStringView text) const;
  [[nodiscard]] TLString stringFromDate(double date) const;

 private:
  struct Format;

  mutable platform::Mutex _mutex;
  const std::unique_ptr<Format> _format TL_PT_GUARDED_BY(_mutex);
  const TLStringView _ending;  // of each strict date; points into the pattern
};

// Creates ISO 8601 formatters. The formatters of a list are lenient and must be tried in order, so
// that a time zone is never skipped; a single one is strict. Styles: 0 no zone, 1 numeric zone, 2 a
// literal Z; null for any other.
class TALDateFormatterFactory {
 public:
  using Formatter = std::unique_ptr<TALDateFormatter>;

  [[nodiscard]] static Formatter newDateTimeFormatterWithTimeZoneStyle(int64_t style);
  [[nodiscard]] static std::vector<Formatter> newDateTimeFormatters();
  [[nodiscard]] static Formatter newDateFormatter();
  [[nodiscard]] static std::vector<Formatter> newDateFormatters();
  [[nodiscard]] static Formatter newTimeFormatterWithTimeZoneStyle(int64_t style);
  [[nodiscard]] static std::vector<Formatter> newTimeFormatters();
};
