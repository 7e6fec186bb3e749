#pragma once

#include <cstddef>

namespace mailscreen {

// A part of the screen, in cells. Without rows or columns it is not shown.
struct Box {
  size_t row = 0;
  size_t column = 0;
  size_t rows = 0;
  size_t columns = 0;

  [[nodiscard]] bool shown() const { return rows > 0 && columns > 0; }
  bool operator==(const Box&) const = default;
};

// Where everything is.
struct Layout {
  Box line;     // that is typed in
  Box list;     // of results
  Box rule;     // between list and preview
  Box preview;  // beside the list where the screen is wide, else below it
  Box page;     // a mail or the help, over all but the status
  Box status;
};

// For a screen of any size, down to nothing. What does not fit goes, the line last.
[[nodiscard]] Layout layoutOf(size_t rows, size_t columns);

}  // namespace mailscreen
