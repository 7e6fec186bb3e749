#include "platform/Redaction.h"

#include <fmt/format.h>

namespace {

constexpr bool kRedact = true;
constexpr size_t kDefaultMaximum = 2;

}  // namespace

std::optional<TLString> TLPartiallyRedactedStringForStringAndMaxLength(
    const std::optional<TLString>& string, size_t maximum) {
  if (!kRedact || !string || string->size() < maximum) return string;
  return u'"' + string->substr(0, maximum) + u"...\"<" +
         platform::fromUTF8(std::to_string(string->size())) + u" chars>";
}

std::optional<TLString> TLPartiallyRedactedStringForString(const std::optional<TLString>& string) {
  return kRedact ? TLPartiallyRedactedStringForStringAndMaxLength(string, kDefaultMaximum) : string;
}

namespace platform {

std::string redacted(const std::optional<TLString>& string) {
  return printable(TLPartiallyRedactedStringForString(string));
}

}  // namespace platform
