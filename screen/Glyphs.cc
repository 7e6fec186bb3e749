#include "screen/Glyphs.h"

#include <unicode/uchar.h>
#include <unicode/utf16.h>
#include <wchar.h>

#include "platform/Text.h"

namespace mailscreen {

namespace {

constexpr char32_t kReplacement = 0xFFFD;
constexpr char32_t kEllipsis = 0x2026;
constexpr char32_t kNonJoiner = 0x200C;  // part of the spelling; takes no column
// The screen library's limit for one cell.
constexpr size_t kMaxCombining = 4;

constexpr bool isVariationSelector(char32_t c) {
  return (c >= 0xFE00 && c <= 0xFE0F) || (c >= 0xE0100 && c <= 0xE01EF);
}

constexpr bool isSkinTone(char32_t c) {
  return c >= 0x1F3FB && c <= 0x1F3FF;
}

bool isLeftOut(char32_t c) {
  if (c == kNonJoiner) return false;
  return isVariationSelector(c) || isSkinTone(c) ||
         u_charType(static_cast<UChar32>(c)) == U_FORMAT_CHAR;
}

template <typename Body>
void forEachCharacter(std::string_view text, const Body& body) {
  const TLString units = platform::fromUTF8(text);
  for (size_t i = 0; i < units.size();) {
    UChar32 c;
    U16_NEXT(units.data(), i, units.size(), c);
    body(static_cast<char32_t>(c));
  }
}

}  // namespace

cli::Palette markingPalette() {
  static constexpr char kMatch[] = {static_cast<char>(markOf(Style::match)), '\0'};
  static constexpr char kFaint[] = {static_cast<char>(markOf(Style::faint)), '\0'};
  static constexpr char kPlain[] = {static_cast<char>(markOf(Style::plain)), '\0'};
  cli::Palette palette(false);
  palette.match = kMatch;
  palette.faint = kFaint;
  palette.end = kPlain;
  return palette;
}

Glyphs glyphsOf(std::string_view text) {
  Glyphs glyphs;
  glyphs.reserve(text.size());
  size_t combining = kMaxCombining;  // without a base character none is kept
  forEachCharacter(text, [&](char32_t c) {
    if (isMark(c) || c == U'\n') {
      glyphs.push_back(c);
      if (c == U'\n') combining = kMaxCombining;
      return;
    }
    if (c >= 0x80 && isLeftOut(c)) return;
    const int width = c < 0x7F && c >= 0x20 ? 1 : wcwidth(static_cast<wchar_t>(c));
    if (width == 0 && ++combining > kMaxCombining) return;
    if (width != 0) combining = 0;
    glyphs.push_back(width < 0 ? kReplacement : c);
  });
  return glyphs;
}

Glyphs lineOfGlyphs(std::string_view text) {
  return glyphsOf(cli::cleanForTerminal(text));
}

std::string toUTF8(GlyphsView glyphs) {
  TLString units;
  for (const char32_t c : glyphs) {
    if (U_IS_BMP(c)) {
      units.push_back(static_cast<char16_t>(c));
    } else {
      units.push_back(U16_LEAD(c));
      units.push_back(U16_TRAIL(c));
    }
  }
  return platform::toUTF8(units);
}

size_t columnsOf(char32_t glyph) {
  if (glyph < 0x7F) return glyph >= 0x20 ? 1 : 0;
  if (glyph == kReplacement) return 1;
  const int width = wcwidth(static_cast<wchar_t>(glyph));
  return width > 0 ? static_cast<size_t>(width) : 0;
}

size_t columnsOf(GlyphsView glyphs) {
  size_t columns = 0;
  for (const char32_t glyph : glyphs) columns += columnsOf(glyph);
  return columns;
}

Glyphs fitted(GlyphsView glyphs, size_t columns) {
  size_t used = 0;
  size_t fits = 0;  // where the ellipsis would go
  for (size_t i = 0; i < glyphs.size(); ++i) {
    const size_t width = columnsOf(glyphs[i]);
    if (used + width > columns) {
      return columns == 0 ? Glyphs() : Glyphs(glyphs.substr(0, fits)) + kEllipsis;
    }
    used += width;
    if (used < columns) fits = i + 1;
  }
  return Glyphs(glyphs);
}

}  // namespace mailscreen
