#include "screen/Document.h"

#include <algorithm>

namespace mailscreen {

namespace {

// A place in the text where a line may end.
struct Place {
  size_t at = 0;
  size_t columns = 0;  // from the start of the line
  Style style = Style::plain;
};

}  // namespace

void Document::set(Glyphs text) {
  _text = std::move(text);
  while (_text.ends_with(U'\n')) _text.pop_back();
  _match = _text.find(markOf(Style::match));
  _lines.clear();
  _columns = 0;
}

void Document::wrap(size_t columns) {
  columns = std::max(columns, size_t{1});
  if (columns == _columns) return;
  _columns = columns;
  _lines.clear();
  Place begin;  // of the line
  Place here;
  Place space;  // after the last space of the line
  const auto endLine = [&](const Place& end, const Place& next) {
    _lines.push_back({static_cast<uint32_t>(begin.at), static_cast<uint32_t>(end.at), begin.style});
    begin = next;
    here.columns -= std::min(here.columns, next.columns);
    begin.columns = 0;
    space = begin;
  };
  const auto after = [&] { return Place{here.at + 1, here.columns, here.style}; };
  for (; here.at < _text.size(); ++here.at) {
    const char32_t glyph = _text[here.at];
    const size_t width = columnsOf(glyph);
    if (isMark(glyph)) {
      here.style = styleOf(glyph);
    } else if (glyph == U'\n' || (glyph == U' ' && here.columns >= columns)) {
      endLine(here, after());
    } else {
      const bool full = width > 0 && here.columns > 0 && here.columns + width > columns;
      if (full && space.at > begin.at) {
        endLine(space, space);
      }
      // The rest after the space may still be too long.
      if (width > 0 && here.columns > 0 && here.columns + width > columns) endLine(here, here);
      here.columns += width;
      if (glyph == U' ') space = after();
    }
  }
  if (!_text.empty()) endLine(here, here);
}

GlyphsView Document::line(size_t index) const {
  const Line& line = _lines[index];
  return GlyphsView(_text).substr(line.begin, line.end - line.begin);
}

std::optional<size_t> Document::firstMatch() const {
  if (_match == Glyphs::npos || _lines.empty()) return std::nullopt;
  const auto after = std::upper_bound(_lines.begin(), _lines.end(), _match,
                                      [](size_t at, const Line& line) { return at < line.begin; });
  return static_cast<size_t>(after - _lines.begin()) - 1;
}

}  // namespace mailscreen
