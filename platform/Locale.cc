#include "platform/Locale.h"

#include <unicode/uloc.h>

#include <array>
#include <cstdlib>

namespace platform {

namespace {

using LocaleFunction = int32_t (*)(const char*, char*, int32_t, UErrorCode*);

// Empty if ICU rejects the name.
std::string ask(LocaleFunction function, const std::string& name) {
  std::array<char, ULOC_FULLNAME_CAPACITY> buffer;
  UErrorCode status = U_ZERO_ERROR;
  const int32_t length =
      function(name.c_str(), buffer.data(), static_cast<int32_t>(buffer.size()), &status);
  if (U_FAILURE(status) || length >= static_cast<int32_t>(buffer.size())) return {};
  return {buffer.data(), static_cast<size_t>(length)};
}

}  // namespace

std::optional<Locale> localeFromName(const std::string& name) {
  if (name.empty() || name.find('\0') != std::string::npos) return std::nullopt;
  Locale locale;
  locale.identifier = ask(uloc_canonicalize, name);
  if (locale.identifier.empty()) return std::nullopt;
  locale.language = ask(uloc_getLanguage, locale.identifier);
  if (locale.language.empty()) return std::nullopt;
  return locale;
}

std::optional<Locale> localeFromPOSIXName(const std::string& name) {
  const std::string plain = name.substr(0, name.find_first_of(".@"));
  if (plain == "C" || plain == "POSIX") return std::nullopt;
  return localeFromName(plain);
}

std::optional<Locale> currentLocale() {
  for (const char* variable : {"LC_ALL", "LC_CTYPE", "LANG"}) {
    const char* value = std::getenv(variable);
    if (value != nullptr && *value != '\0') return localeFromPOSIXName(value);
  }
  return std::nullopt;
}

}  // namespace platform
