#pragma once

#include <optional>
#include <string>

namespace platform {

struct Locale {
  std::string identifier;  // ICU's canonical form, e.g. "en_US"
  std::string language;    // its language code, e.g. "en"

  bool operator==(const Locale&) const = default;
};

// None for a name that ICU finds no language in, or that holds a NUL.
[[nodiscard]] std::optional<Locale> localeFromName(const std::string& name);

// The locale that a POSIX name such as "de_DE.UTF-8@euro" stands for, without character set and
// modifier. None for "C" and "POSIX" as well.
[[nodiscard]] std::optional<Locale> localeFromPOSIXName(const std::string& name);

// The locale of the first of LC_ALL, LC_CTYPE and LANG that is set and not empty. Reads the
// environment at each call; nothing may change that at the same time.
[[nodiscard]] std::optional<Locale> currentLocale();

}  // namespace platform
