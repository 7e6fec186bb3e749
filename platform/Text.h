#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

// The text type of interfaces, records and tokenizers: UTF-16 code units, not checked for lone
// surrogates. A nullable text is a std::optional of it.
using TLString = std::u16string;
using TLStringView = std::u16string_view;

namespace platform {

// Both conversions accept any input; invalid sequences become U+FFFD. ASCII-only text is converted
// without ICU.
[[nodiscard]] std::string toUTF8(TLStringView text);
[[nodiscard]] TLString fromUTF8(std::string_view bytes);

// Like toUTF8, appending to `out`.
void appendUTF8(TLStringView text, std::string& out);

// The number of leading bytes or units below 0x80.
[[nodiscard]] size_t asciiPrefixLength(std::string_view bytes);
[[nodiscard]] size_t asciiPrefixLength(TLStringView text);

// Characters of ASCII, whatever the locale; bytes from 0x80 on are none of them.
[[nodiscard]] constexpr bool isDigit(char c) {
  return c >= '0' && c <= '9';
}
[[nodiscard]] constexpr bool isWhiteSpace(char c) {
  return c == ' ' || (c >= '\t' && c <= '\r');
}

// Whether `bytes` is well-formed UTF-8.
[[nodiscard]] bool isValidUTF8(std::string_view bytes);

// The pieces of `text` between separators, one more than there are separators. The views point into
// `text`.
[[nodiscard]] std::vector<TLStringView> split(TLStringView text, TLStringView separator);

// For log lines: the text in UTF-8, or "(null)".
[[nodiscard]] std::string printable(const std::optional<TLString>& text);
[[nodiscard]] std::string printable(TLStringView text);

// The text as a view; empty if it is missing.
[[nodiscard]] inline TLStringView orEmpty(const std::optional<TLString>& text) {
  return text ? TLStringView(*text) : TLStringView();
}

}  // namespace platform
