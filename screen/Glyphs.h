#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "cli/Terminal.h"

// Text on its way to the cells of a terminal.
namespace mailscreen {

// How a part of a text is drawn.
enum class Style : uint8_t { plain, match, faint };

// Characters that are safe to draw, and marks: a mark is a control character, takes no column, and
// stands where a style begins.
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

// The marks as the "colours" of a text in UTF-8.
[[nodiscard]] cli::Palette markingPalette();

// Makes glyphs of a clean text (see cleanForTerminal) with marks; line feeds stay. What terminals
// disagree about, and would move the cells after it, is left out: format characters such as
// joiners, variation selectors and skin tones, and combining characters without a base or after
// four others. What the locale's terminal cannot show becomes U+FFFD.
[[nodiscard]] Glyphs glyphsOf(std::string_view text);

// Any text on one line, cleaned first.
[[nodiscard]] Glyphs lineOfGlyphs(std::string_view text);

[[nodiscard]] std::string toUTF8(GlyphsView glyphs);

// Columns of one glyph (0, 1 or 2), and of several, by the locale.
[[nodiscard]] size_t columnsOf(char32_t glyph);
[[nodiscard]] size_t columnsOf(GlyphsView glyphs);

// The beginning that takes at most so many columns, with "…" at its end where something is cut off.
[[nodiscard]] Glyphs fitted(GlyphsView glyphs, size_t columns);

}  // namespace mailscreen
