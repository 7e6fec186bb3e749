#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

// Parts of HTML pages: escaped text, numbers, and charts as SVG without any text in it, so that
// they fill any width.
namespace cli {

// Text for an element or a quoted attribute: valid UTF-8 without control characters and changes of
// direction, cut to `kMaxPageText` columns.
inline constexpr size_t kMaxPageText = 500;
[[nodiscard]] std::string escapedHTML(std::string_view text);

// Such as 12,345.
[[nodiscard]] std::string groupedNumber(int64_t number);

// One column of a chart.
struct Bar {
  std::string label;  // such as a month
  double value = 0;
  std::string text;  // the value as shown when it is pointed to
  double span = 1;   // the width, relative to others
};

struct Chart {
  std::string title;
  std::string most;  // the largest value, as shown at the top
  std::vector<Bar> bars;
  bool gaps = true;  // between the bars
};

// A figure with the first and the last label below it. All texts are escaped here.
[[nodiscard]] std::string chartHTML(const Chart& chart);

// A part of a bar that lies on its side.
struct Share {
  const char* style;  // the class of the part
  double value = 0;
};

// The parts side by side, where `whole` fills the width.
[[nodiscard]] std::string shareHTML(const std::vector<Share>& shares, double whole);

// The whole page. The policy allows this style sheet and nothing else: no script, no address.
[[nodiscard]] std::string pageHTML(std::string_view title, std::string_view style,
                                   std::string_view body);

}  // namespace cli
