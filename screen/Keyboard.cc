#include "screen/Keyboard.h"

#include <unicode/utf8.h>

#include <algorithm>
#include <utility>

#include "screen/Curses.h"
#include "screen/TerminalSession.h"

namespace mailscreen {

namespace {

constexpr int kEscape = 27;
// Maximum bytes of one paste; the rest is dropped.
constexpr size_t kMaxText = size_t{64} << 10;

constexpr int control(char letter) {
  return letter & 0x1F;
}

struct Code {
  int code;
  Key key;
};

constexpr Code kCodes[] = {
    {'\r', Key::enter},
    {'\n', Key::enter},
    {KEY_ENTER, Key::enter},
    {control('C'), Key::interrupt},
    {control('Z'), Key::suspend},
    {control('L'), Key::redraw},
    {KEY_LEFT, Key::left},
    {control('B'), Key::left},
    {KEY_RIGHT, Key::right},
    {KEY_UP, Key::up},
    {control('P'), Key::up},
    {KEY_DOWN, Key::down},
    {control('N'), Key::down},
    {KEY_HOME, Key::home},
    {control('A'), Key::home},
    {KEY_END, Key::end},
    {control('E'), Key::end},
    {KEY_PPAGE, Key::pageUp},
    {KEY_NPAGE, Key::pageDown},
    {KEY_BACKSPACE, Key::deleteBefore},
    {control('H'), Key::deleteBefore},
    {0x7F, Key::deleteBefore},
    {KEY_DC, Key::deleteAfter},
    {control('D'), Key::deleteAfter},
    {control('W'), Key::deleteWord},
    {control('U'), Key::deleteToStart},
    {control('K'), Key::deleteToEnd},
    {control('T'), Key::threads},
    {control('S'), Key::order},
    {control('F'), Key::folder},
    {control('Y'), Key::copy},
    {control('O'), Key::open},
    {KEY_F(1), Key::help},
};

// The number of bytes of an incomplete character at the end of a text.
size_t incompleteBytes(const std::string& text) {
  const size_t most = std::min(text.size(), size_t{3});
  for (size_t count = 1; count <= most; ++count) {
    const auto byte = static_cast<unsigned char>(text[text.size() - count]);
    if (U8_IS_TRAIL(byte)) continue;
    return U8_IS_LEAD(byte) && static_cast<size_t>(U8_COUNT_TRAIL_BYTES(byte)) >= count ? count : 0;
  }
  return 0;
}

}  // namespace

std::vector<Event> Keyboard::read() {
  for (int code = wgetch(stdscr); code != ERR; code = wgetch(stdscr)) take(code);
  // The rest of the character arrives with the next bytes.
  const size_t open = incompleteBytes(_text);
  std::string rest = _text.substr(_text.size() - open);
  _text.resize(_text.size() - open);
  endText();
  _text = std::move(rest);
  return std::exchange(_events, {});
}

// Pasted input is text, even if it looks like a key. Only Ctrl-C keeps its meaning, to end an
// endless paste.
void Keyboard::take(int code) {
  const bool byte = code < 0x100;
  const bool character = byte && code >= 0x20 && code != 0x7F;
  if (code == TerminalSession::kPasteBegins || code == TerminalSession::kPasteEnds) {
    _pasting = code == TerminalSession::kPasteBegins;
  } else if (character || (_pasting && byte && code != control('C'))) {
    takeByte(static_cast<char>(code));
  } else if (_pasting && !byte) {
    takeByte(' ');
  } else if (code == kEscape) {
    takeEscape();
  } else {
    const auto* const found = std::find_if(std::begin(kCodes), std::end(kCodes),
                                           [code](const Code& row) { return row.code == code; });
    if (found != std::end(kCodes)) add(found->key);
  }
}

void Keyboard::takeByte(char byte) {
  const bool isControl = (byte >= 0 && byte < 0x20) || byte == 0x7F;
  if (_text.size() < kMaxText) _text.push_back(isControl ? ' ' : byte);
}

// Escape alone is the escape key. Followed by other characters it is an unknown key, such as one
// with Alt, and those characters belong to it.
void Keyboard::takeEscape() {
  constexpr int kMaxCode = 32;
  int code = wgetch(stdscr);
  if (code == ERR || code == kEscape) return add(Key::escape);
  if (code != '[' && code != 'O') return;
  for (int i = 0; i < kMaxCode && code != ERR; ++i) {
    code = wgetch(stdscr);
    if (code >= 0x40 && code <= 0x7E) return;
  }
}

void Keyboard::endText() {
  if (!_text.empty()) _events.push_back({Key::text, std::exchange(_text, {})});
}

void Keyboard::add(Key key) {
  endText();
  _events.push_back({key});
}

}  // namespace mailscreen
