#pragma once

#include <string>

#include "screen/Event.h"
#include "screen/Glyphs.h"

namespace mailscreen {

// An input line with a cursor. A combining character belongs to the character before it.
class LineEditor {
 public:
  // Further input is dropped.
  static constexpr size_t kMaxGlyphs = 2000;

  // Replaces the text and puts the cursor at its end.
  void set(std::string_view text);

  // True if the text has changed.
  bool press(const Event& event);

  [[nodiscard]] std::string text() const { return toUTF8(_glyphs); }
  [[nodiscard]] const Glyphs& glyphs() const { return _glyphs; }
  // The index of the glyph at the cursor.
  [[nodiscard]] size_t cursor() const { return _cursor; }
  [[nodiscard]] bool empty() const { return _glyphs.empty(); }

 private:
  bool insert(std::string_view text);
  bool erase(size_t begin, size_t end);
  [[nodiscard]] size_t before(size_t place) const;
  [[nodiscard]] size_t after(size_t place) const;
  [[nodiscard]] size_t startOfWord() const;

  Glyphs _glyphs;
  size_t _cursor = 0;
};

}  // namespace mailscreen
