#pragma once

#include <cstdint>
#include <optional>
#include <vector>

#include "screen/Glyphs.h"

namespace mailscreen {

// A text of many lines, broken to fit a width. At most 4 GiB of glyphs.
class Document {
 public:
  void set(Glyphs text);

  // Breaks lines between words where it can, so that none takes more columns; a wide glyph in a
  // single column has a line of its own. Does nothing where the text is broken so.
  void wrap(size_t columns);

  [[nodiscard]] size_t lines() const { return _lines.size(); }
  // A line with its marks, and the style that it begins with.
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
