#pragma once

#include "screen/Model.h"

namespace mailscreen {

// Draws a model on the terminal of the TerminalSession. Writes only changed cells, as one update if
// the terminal supports it.
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
  // Draws glyphs with their marks into `columns` columns of a row, padded with spaces.
  void put(size_t row, size_t column, size_t columns, GlyphsView glyphs,
           Style style = Style::plain) const;
  void setStyle(Style style) const;

  const bool _colored;
  // The attributes that all glyphs of a part share, in the library's form.
  unsigned long _base = 0;
};

}  // namespace mailscreen
