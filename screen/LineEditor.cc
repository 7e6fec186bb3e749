#include "screen/LineEditor.h"

#include <algorithm>

namespace mailscreen {

void LineEditor::set(std::string_view text) {
  _glyphs.clear();
  _cursor = 0;
  insert(text);
}

bool LineEditor::press(const Event& event) {
  switch (event.key) {
    case Key::text:
      return insert(event.text);
    case Key::left:
      _cursor = before(_cursor);
      return false;
    case Key::right:
      _cursor = after(_cursor);
      return false;
    case Key::home:
      _cursor = 0;
      return false;
    case Key::end:
      _cursor = _glyphs.size();
      return false;
    case Key::deleteBefore:
      return erase(before(_cursor), _cursor);
    case Key::deleteAfter:
      return erase(_cursor, after(_cursor));
    case Key::deleteWord:
      return erase(startOfWord(), _cursor);
    case Key::deleteToStart:
      return erase(0, _cursor);
    case Key::deleteToEnd:
      return erase(_cursor, _glyphs.size());
    default:
      return false;
  }
}

bool LineEditor::insert(std::string_view text) {
  // The base of a typed combining character may already be in the line.
  const bool hasBase = _cursor > 0;
  Glyphs typed = lineOfGlyphs(hasBase ? '.' + std::string(text) : std::string(text));
  if (hasBase) typed.erase(0, 1);
  std::erase(typed, U'\uFFFD');
  typed.resize(std::min(typed.size(), kMaxGlyphs - _glyphs.size()));
  _glyphs.insert(_cursor, typed);
  _cursor += typed.size();
  return !typed.empty();
}

bool LineEditor::erase(size_t begin, size_t end) {
  _glyphs.erase(begin, end - begin);
  _cursor = begin;
  return end > begin;
}

size_t LineEditor::before(size_t place) const {
  while (place > 0 && columnsOf(_glyphs[--place]) == 0) {
  }
  return place;
}

size_t LineEditor::after(size_t place) const {
  if (place < _glyphs.size()) ++place;
  while (place < _glyphs.size() && columnsOf(_glyphs[place]) == 0) ++place;
  return place;
}

size_t LineEditor::startOfWord() const {
  size_t place = _cursor;
  while (place > 0 && _glyphs[place - 1] == U' ') --place;
  while (place > 0 && _glyphs[place - 1] != U' ') --place;
  return place;
}

}  // namespace mailscreen
