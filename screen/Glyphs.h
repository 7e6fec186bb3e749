#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "cli/Terminal.h"

// Text prepared for the cells of a terminal.
namespace mailscreen {

// The style of a part of a text.
enum class Style : uint8_t { plain, match, faint };

// Characters that are safe to draw, and marks. A mark is a control character that takes no column
// and stands where a style begins.
using Glyphs = std::u32string;
using GlyphsView = std::u32string_view;

[[nodiscard]] constexpr char32_t markOf(Style style) {
  return static_cast<char32_t>(style) + 1;
}
[[nodiscard]] constexpr bool isMark(char32_t c) {
  return c >= markOf(Style::plain) && c <= markOf(Style::faint);
}
[[nodiscard]] constexpr Style styleOf(char32_t mark) {
  return static_cast<Style>(mark - 1);
}

// A palette whose "colours" are the marks, for texts in UTF-8.
[[nodiscard]] cli::Palette markingPalette();

// Converts a clean text (see cleanForTerminal) with marks to glyphs. Line feeds are kept.
// Characters whose width differs between terminals, and so would shift the cells after them, are
// dropped: format characters such as joiners, variation selectors and skin tones, and combining
// characters without a base or after four others. Characters that the locale cannot show become
// U+FFFD.
[[nodiscard]] Glyphs glyphsOf(std::string_view text);

// Cleans any text and converts it to one line of glyphs.
[[nodiscard]] Glyphs lineOfGlyphs(std::string_view text);

[[nodiscard]] std::string toUTF8(GlyphsView glyphs);

// The width in columns of one glyph (0, 1 or 2) or of several, according to the locale.
[[nodiscard]] size_t columnsOf(char32_t glyph);
[[nodiscard]] size_t columnsOf(GlyphsView glyphs);

// The longest prefix that fits into `columns`, ending with "…" if something is cut off.
[[nodiscard]] Glyphs fitted(GlyphsView glyphs, size_t columns);

}  // namespace mailscreen
