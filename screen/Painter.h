#pragma once

#include "screen/Model.h"

namespace mailscreen {

// Draws a model on the terminal of the TerminalSession. Only cells that have changed are written,
// as one update where the terminal knows how.
class Painter {
 public:
  explicit Painter(bool colored);

  void paint(const Model& model);

 private:
  void paintLine(const Model& model);
  void paintList(const Model& model);
  void paintRow(const Row& row, bool selected, size_t screenRow, const Box& box);
  void paintRule(const Box& box);
  void paintDocument(const Model& model, const Box& box);
  void paintStatus(const Model& model);
  void placeCursor(const Model& model);
  // Draws glyphs with their marks into so many columns of a row, and spaces after them.
  void put(size_t row, size_t column, size_t columns, GlyphsView glyphs,
           Style style = Style::plain) const;
  void setStyle(Style style) const;

  const bool _colored;
  // What the glyphs of a part have in common, as attributes of the library.
  unsigned long _base = 0;
};

}  // namespace mailscreen
