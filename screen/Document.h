#pragma once

#include <cstdint>
#include <optional>
#include <vector>

#include "screen/Glyphs.h"

namespace mailscreen {

// A text of many lines, wrapped to a width. At most 4 GiB of glyphs.
class Document {
 public:
  void set(Glyphs text);

  // Wraps lines to the width, between words if possible. A wide glyph in a single column has its
  // own line. Does nothing if the text is already wrapped to this width.
  void wrap(size_t columns);

  [[nodiscard]] size_t lines() const { return _lines.size(); }
  // The glyphs of a line with their marks, and the style at the start of the line.
  [[nodiscard]] GlyphsView line(size_t index) const;
  [[nodiscard]] Style styleOfLine(size_t index) const { return _lines[index].style; }
  // The line of the first match.
  [[nodiscard]] std::optional<size_t> firstMatch() const;

 private:
  struct Line {
    uint32_t begin;
    uint32_t end;
    Style style;
  };

  Glyphs _text;
  std::vector<Line> _lines;
  size_t _columns = 0;
  size_t _match = Glyphs::npos;  // the first
};

}  // namespace mailscreen
