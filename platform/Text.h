#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

// Text of the interface, the records and the tokenizers: UTF-16 code units, not checked for lone
// surrogates. A nullable text is a std::optional of it.
using TLString = std::u16string;
using TLStringView = std::u16string_view;

namespace platform {

// Both conversions accept any input: what is no valid sequence comes out as U+FFFD. Text that is
// all ASCII is widened or narrowed without a call into ICU.
[[nodiscard]] std::string toUTF8(TLStringView text);
[[nodiscard]] TLString fromUTF8(std::string_view bytes);

// As toUTF8, appended to `out`.
void appendUTF8(TLStringView text, std::string& out);

// Number of leading bytes, or units, below 0x80.
[[nodiscard]] size_t asciiPrefixLength(std::string_view bytes);
[[nodiscard]] size_t asciiPrefixLength(TLStringView text);

// True when `bytes` is well-formed UTF-8.
[[nodiscard]] bool isValidUTF8(std::string_view bytes);

// The pieces of `text` between the separators, one more than there are of them. Views into `text`.
[[nodiscard]] std::vector<TLStringView> split(TLStringView text, TLStringView separator);

// For log lines: the text in UTF-8, "(null)" for a missing one.
[[nodiscard]] std::string printable(const std::optional<TLString>& text);
[[nodiscard]] std::string printable(TLStringView text);

// A text as a view, empty for a missing one.
[[nodiscard]] inline TLStringView orEmpty(const std::optional<TLString>& text) {
  return text ? TLStringView(*text) : TLStringView();
}

}  // namespace platform
