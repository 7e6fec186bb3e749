#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/Mutex.h"
#include "platform/Text.h"

// Reads and writes dates by one pattern of ICU, with the locale en_US_POSIX, in UTC. A date is
// seconds since 1970-01-01 00:00:00 UTC; what a pattern leaves open is that of this moment. Any
// thread; calls wait for each other.
class TALDateFormatter {
 public:
  enum class Mode { strict, lenient };

  // `pattern` outlives this.
  TALDateFormatter(const char16_t* pattern, Mode mode);
  ~TALDateFormatter();
  TALDateFormatter(const TALDateFormatter&) = delete;
  TALDateFormatter& operator=(const TALDateFormatter&) = delete;

  // None unless the whole text is a date of the pattern.
  [[nodiscard]] std::optional<double> dateFromString(TLStringView text) const;
  [[nodiscard]] TLString stringFromDate(double date) const;

 private:
  struct Format;

  mutable platform::Mutex _mutex;
  const std::unique_ptr<Format> _format TL_PT_GUARDED_BY(_mutex);
  const TLStringView _ending;  // of each strict date; part of the pattern, which lives as long
};

// Makes formatters of ISO 8601. Those of a list are lenient and to be tried in order, so that a
// zone is never passed over; a single one is strict. Styles: 0 no zone, 1 numeric zone, 2 a literal
// Z; null for any other.
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
