#pragma once

#include <string>

namespace mailscreen {

// The meaning of a key, independent of the code that the terminal sends.
enum class Key {
  text,  // typed or pasted
  enter,
  escape,
  interrupt,
  suspend,
  redraw,
  left,
  right,
  up,
  down,
  home,
  end,
  pageUp,
  pageDown,
  deleteBefore,
  deleteAfter,
  deleteWord,
  deleteToStart,
  deleteToEnd,
  threads,
  order,
  folder,
  copy,
  open,
  help
};

struct Event {
  Key key = Key::text;
  std::string text = {};  // of Key::text, UTF-8
};

}  // namespace mailscreen
