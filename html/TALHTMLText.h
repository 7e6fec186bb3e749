#pragma once

#include <algorithm>
#include <string_view>

#include "platform/Text.h"

// HTML comparison of bytes: ASCII letters case-insensitively, ASCII white space only.
namespace htmltext {

inline constexpr std::string_view kWhiteSpace = " \t\n\v\f\r";

using platform::isWhiteSpace;

[[nodiscard]] inline char lower(char c) {
  return c >= 'A' && c <= 'Z' ? static_cast<char>(c + 32) : c;
}

// `lowered` must be in lower case.
[[nodiscard]] inline bool beginsWith(std::string_view bytes, std::string_view lowered) {
  return bytes.size() >= lowered.size() && std::equal(lowered.begin(), lowered.end(), bytes.begin(),
                                                      [](char a, char b) { return a == lower(b); });
}

[[nodiscard]] inline bool equals(std::string_view bytes, std::string_view lowered) {
  return bytes.size() == lowered.size() && beginsWith(bytes, lowered);
}

// The position of `lowered`, which must not be empty, or npos.
[[nodiscard]] inline size_t find(std::string_view bytes, std::string_view lowered) {
  const auto at = std::search(bytes.begin(), bytes.end(), lowered.begin(), lowered.end(),
                              [](char a, char b) { return lower(a) == b; });
  return at == bytes.end() ? std::string_view::npos : static_cast<size_t>(at - bytes.begin());
}

[[nodiscard]] inline std::string_view trim(std::string_view bytes) {
  const size_t first = bytes.find_first_not_of(kWhiteSpace);
  if (first == std::string_view::npos) return {};
  return bytes.substr(first, bytes.find_last_not_of(kWhiteSpace) - first + 1);
}

}  // namespace htmltext
