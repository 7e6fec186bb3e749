#pragma once

#include <string>

namespace mailscreen {

// What a key means, whatever the terminal sends for it.
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
