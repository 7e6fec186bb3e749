#pragma once

#include <optional>
#include <string>

namespace platform {

struct Locale {
  std::string identifier;  // ICU's canonical form, e.g. "en_US"
  std::string language;    // its language code, e.g. "en"

  bool operator==(const Locale&) const = default;
};

// Nullopt for a name in which ICU finds no language, or that contains NUL.
[[nodiscard]] std::optional<Locale> localeFromName(const std::string& name);

// The locale of a POSIX name such as "de_DE.UTF-8@euro", ignoring character set and modifier.
// Nullopt for "C" and "POSIX" as well.
[[nodiscard]] std::optional<Locale> localeFromPOSIXName(const std::string& name);

// The locale of the first of LC_ALL, LC_CTYPE and LANG that is set and not empty. Reads the
// environment at each call; nothing may change it meanwhile.
[[nodiscard]] std::optional<Locale> currentLocale();

}  // namespace platform
