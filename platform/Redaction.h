#pragma once

#include <optional>

#include "platform/Text.h"

// Keeps personal text out of the log. While redaction is on (it always is), a text of at least
// `maximum` UTF-16 units becomes its first `maximum` units in quotes and its length; a shorter one
// stays as it is.
[[nodiscard]] std::optional<TLString> TLPartiallyRedactedStringForStringAndMaxLength(
    const std::optional<TLString>& string, size_t maximum);

// The same with a maximum of 2.
[[nodiscard]] std::optional<TLString> TLPartiallyRedactedStringForString(
    const std::optional<TLString>& string);

namespace platform {

// For log lines: the redacted form in UTF-8, "(null)" for a missing text.
[[nodiscard]] std::string redacted(const std::optional<TLString>& string);

}  // namespace platform
