#pragma once

#include <string>
#include <vector>

#include "screen/Event.h"

namespace mailscreen {

// Reads the input of the TerminalSession's terminal as events.
class Keyboard {
 public:
  // All events since the last call. Waits only for the rest of a key's code.
  [[nodiscard]] std::vector<Event> read();

 private:
  void take(int code);
  void takeByte(char byte);
  void takeEscape();
  void endText();
  void add(Key key);

  std::vector<Event> _events;
  std::string _text;  // the last bytes typed; the last character may be incomplete
  bool _pasting = false;
};

}  // namespace mailscreen
