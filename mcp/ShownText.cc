#include "mcp/ShownText.h"

#include <algorithm>

#include "cli/Terminal.h"
#include "platform/Text.h"

namespace mcp {

namespace {

struct Range {
  char32_t first;
  char32_t last;
};
constexpr Range kInvisible[] = {{0x00AD, 0x00AD},     // soft hyphen
                                {0x200B, 0x200B},     // zero-width space
                                {0x2060, 0x206F},     // word joiner, invisible operators
                                {0xFE00, 0xFE0F},     // variation selectors
                                {0xFEFF, 0xFEFF},     // zero-width no-break space
                                {0xE0000, 0xE0FFF}};  // tags, variation selectors

bool isInvisible(char32_t c) {
  return std::any_of(std::begin(kInvisible), std::end(kInvisible),
                     [c](const Range& range) { return c >= range.first && c <= range.last; });
}

bool startsCodePoint(char byte) {
  return (static_cast<unsigned char>(byte) & 0xC0) != 0x80;
}

// The code point at `at` of valid UTF-8, and its length in bytes.
char32_t codePointAt(std::string_view text, size_t at, size_t& bytes) {
  const auto lead = static_cast<unsigned char>(text[at]);
  bytes = lead < 0x80 ? 1 : lead < 0xE0 ? 2 : lead < 0xF0 ? 3 : 4;
  char32_t c = bytes == 1 ? lead : lead & (0x7FU >> bytes);
  for (size_t i = 1; i < bytes; ++i) {
    c = (c << 6) | (static_cast<unsigned char>(text[at + i]) & 0x3FU);
  }
  return c;
}

std::string withoutInvisible(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  for (size_t at = 0, bytes = 0; at < text.size(); at += bytes) {
    if (!isInvisible(codePointAt(text, at, bytes))) out.append(text, at, bytes);
  }
  return out;
}

// The place in bytes of a code point, by its number; the end for a larger one.
size_t placeOf(std::string_view text, size_t number) {
  size_t at = 0;
  for (; at < text.size(); ++at) {
    if (startsCodePoint(text[at]) && number-- == 0) break;
  }
  return at;
}

}  // namespace

std::string shownText(std::string_view text, size_t most) {
  // Enough for `most` code points even if many are left out; the rest is not looked at.
  constexpr size_t kBytesPerCodePoint = 16;
  const std::string clean =
      withoutInvisible(cli::cleanLinesForTerminal(text.substr(0, most * kBytesPerCodePoint)));
  const size_t end = placeOf(clean, most);
  const bool all = end == clean.size() && text.size() <= most * kBytesPerCodePoint;
  return clean.substr(0, end) + (all ? "" : "…");
}

std::string partOf(std::string_view text, size_t from, size_t most, size_t& next) {
  const std::string clean = withoutInvisible(cli::cleanLinesForTerminal(text));
  const std::string_view rest = std::string_view(clean).substr(placeOf(clean, from));
  const size_t end = placeOf(rest, most);
  next = end == rest.size() ? 0 : from + most;
  return std::string(rest.substr(0, end));
}

}  // namespace mcp
