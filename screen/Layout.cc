#include "screen/Layout.h"

#include <algorithm>

namespace mailscreen {

namespace {

constexpr size_t kWide = 100;     // columns from which the preview is next to the list
constexpr size_t kHigh = 9;       // rows from which the preview fits below the list
constexpr size_t kMinListed = 4;  // rows

}  // namespace

Layout layoutOf(size_t rows, size_t columns) {
  Layout layout;
  if (rows == 0 || columns == 0) return layout;
  layout.line = {0, 0, 1, columns};
  layout.page = {0, 0, std::max(rows - 1, size_t{1}), columns};
  if (rows == 1) return layout;
  layout.status = {rows - 1, 0, 1, columns};
  const size_t body = rows - 2;
  layout.list = {1, 0, body, columns};
  if (body > 0 && columns >= kWide) {
    const size_t listed = columns * 9 / 20;
    layout.list.columns = listed;
    layout.rule = {1, listed, body, 1};
    layout.preview = {1, listed + 2, body, columns - listed - 2};
  } else if (body >= kHigh) {
    const size_t listed = std::max(kMinListed, body * 2 / 5);
    layout.list.rows = listed;
    layout.rule = {1 + listed, 0, 1, columns};
    layout.preview = {2 + listed, 0, body - listed - 1, columns};
  }
  return layout;
}

}  // namespace mailscreen
