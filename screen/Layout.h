#pragma once

#include <cstddef>

namespace mailscreen {

// A part of the screen, in cells. Not shown if it has no rows or no columns.
struct Box {
  size_t row = 0;
  size_t column = 0;
  size_t rows = 0;
  size_t columns = 0;

  [[nodiscard]] bool shown() const { return rows > 0 && columns > 0; }
  bool operator==(const Box&) const = default;
};

// The places of all parts.
struct Layout {
  Box line;     // the input line
  Box list;     // of results
  Box rule;     // between list and preview
  Box preview;  // next to the list on a wide screen, otherwise below it
  Box page;     // a mail or the help, covering everything except the status
  Box status;
};

// Works for any screen size, including zero. Parts that do not fit are left out, the input line
// last.
[[nodiscard]] Layout layoutOf(size_t rows, size_t columns);

}  // namespace mailscreen
