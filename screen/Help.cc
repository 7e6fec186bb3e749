#include "screen/Help.h"

#include <fmt/format.h>

namespace mailscreen {

namespace {

struct Row {
  const char* keys;
  const char* meaning;  // null for a heading
};

constexpr Row kRows[] = {
    {"Search as you type", nullptr},
    {"type", "results change with each key; the last word may go on"},
    {"Up, Down", "another result"},
    {"Enter", "read the mail"},
    {"PageDown, PageUp", "next and previous page of results"},
    {"Ctrl-T", "results by conversation, or one by one"},
    {"Ctrl-S", "by relevance, or the newest first"},
    {"Ctrl-F", "only mail in one folder"},
    {"Ctrl-Y", "copy the path of the mail, and show it"},
    {"Ctrl-O", "open the mail with $TALLOW_OPEN"},
    {"F1, ? first", "this help"},
    {"Esc, Ctrl-C", "leave"},
    {"In the line", nullptr},
    {"Left, Right", "move; Home and Ctrl-A, End and Ctrl-E to the ends"},
    {"Ctrl-W", "delete a word; Ctrl-U to the start, Ctrl-K to the end"},
    {"In a mail", nullptr},
    {"Up, Down", "scroll; also j and k"},
    {"Space, b", "a page down and up; also PageDown and PageUp"},
    {"n, p", "next and previous result"},
    {"y, o", "copy the path, open"},
    {"q, Esc", "back to the results"},
    {"What can be typed", nullptr},
    {"mara inv", "mail with the word mara and a word that begins with inv"},
    {"\"three loans\"", "words that stand side by side"},
    {"from:mara -draft", "a field; without a word"},
    {"date:2010..", "from 2010 on; man tallow-search tells the rest"},
    {"@bills", "a search that `tallow save` has kept"},
};

}  // namespace

Glyphs helpText() {
  const cli::Palette marks = markingPalette();
  std::string text;
  for (const Row& row : kRows) {
    if (row.meaning == nullptr) {
      text += fmt::format("{}{}{}{}\n", text.empty() ? "" : "\n", marks.match, row.keys, marks.end);
    } else {
      text += fmt::format("  {:18} {}\n", row.keys, row.meaning);
    }
  }
  return glyphsOf(text);
}

}  // namespace mailscreen
