#pragma once

#include <string>
#include <vector>

#include "screen/Event.h"

namespace mailscreen {

// What is typed at the terminal of the TerminalSession, as events.
class Keyboard {
 public:
  // All that has been typed since the last call; does not wait, but for the rest of a key's code.
  [[nodiscard]] std::vector<Event> read();

 private:
  void take(int code);
  void takeByte(char byte);
  void takeEscape();
  void endText();
  void add(Key key);

  std::vector<Event> _events;
  std::string _text;  // the last bytes typed, of which the last character may be incomplete
  bool _pasting = false;
};

}  // namespace mailscreen
