#pragma once

#include <optional>

#include "platform/Text.h"

// Keeps personal text out of the log. While redaction is on (it always is), a text of at least
// `maximum` UTF-16 units is reduced to its first `maximum` units in quotes and its length; a
// shorter one is unchanged.
[[nodiscard]] std::optional<TLString> TLPartiallyRedactedStringForStringAndMaxLength(
    const std::optional<TLString>& string, size_t maximum);

// The same with a maximum of 2.
[[nodiscard]] std::optional<TLString> TLPartiallyRedactedStringForString(
    const std::optional<TLString>& string);

namespace platform {

// For log lines: the redacted text in UTF-8, or "(null)".
[[nodiscard]] std::string redacted(const std::optional<TLString>& string);

}  // namespace platform
