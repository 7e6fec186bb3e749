#include "cli/PageParts.h"

#include <fmt/format.h>
#include <glib.h>

#include <algorithm>
#include <cstdlib>

#include "cli/Terminal.h"

namespace cli {

namespace {

// The size of all drawings in their own units.
constexpr double kWidth = 1000;
constexpr double kHeight = 100;
constexpr double kMinHeight = 1;  // of a value above 0, so that it is seen
constexpr double kGap = 0.2;      // of the space of a bar

// A hash as a content security policy has it.
std::string hashOf(std::string_view text) {
  GChecksum* const sum = g_checksum_new(G_CHECKSUM_SHA256);
  g_checksum_update(sum, reinterpret_cast<const guchar*>(text.data()),
                    static_cast<gssize>(text.size()));
  guint8 digest[32];
  gsize size = sizeof digest;
  g_checksum_get_digest(sum, digest, &size);
  g_checksum_free(sum);
  char* const encoded = g_base64_encode(digest, size);
  std::string hash = fmt::format("sha256-{}", encoded);
  g_free(encoded);
  return hash;
}

std::string barSVG(const Bar& bar, double x, double width, double most) {
  const double share = most > 0 ? std::clamp(bar.value / most, 0.0, 1.0) : 0;
  const double height = share > 0 ? std::max(share * kHeight, kMinHeight) : 0;
  // The hidden part makes all of the column show the value when it is pointed to.
  return fmt::format(
      "<g><title>{}: {}</title><rect class=\"back\" x=\"{:.2f}\" y=\"0\" width=\"{:.2f}\" "
      "height=\"{}\"/><rect class=\"bar\" x=\"{:.2f}\" y=\"{:.2f}\" width=\"{:.2f}\" "
      "height=\"{:.2f}\"/></g>",
      escapedHTML(bar.label), escapedHTML(bar.text), x, width, kHeight, x, kHeight - height, width,
      height);
}

std::string barsSVG(const Chart& chart) {
  double spans = 0;
  double most = 0;
  for (const Bar& bar : chart.bars) {
    spans += bar.span;
    most = std::max(most, bar.value);
  }
  std::string svg;
  double x = 0;
  for (const Bar& bar : chart.bars) {
    const double width = kWidth * bar.span / spans;
    const double gap = chart.gaps ? width * kGap : 0;
    svg += barSVG(bar, x + gap / 2, width - gap, most);
    x += width;
  }
  return svg;
}

std::string svgHTML(std::string_view name, std::string_view label, double height,
                    std::string_view content) {
  return fmt::format(
      "<svg class=\"{}\" viewBox=\"0 0 {} {}\" preserveAspectRatio=\"none\" role=\"img\" "
      "aria-label=\"{}\">{}</svg>",
      name, kWidth, height, escapedHTML(label), content);
}

}  // namespace

std::string escapedHTML(std::string_view text) {
  std::string escaped;
  for (const char c : fitted(cleanForTerminal(text), kMaxPageText)) {
    switch (c) {
      case '&':
        escaped += "&amp;";
        break;
      case '<':
        escaped += "&lt;";
        break;
      case '>':
        escaped += "&gt;";
        break;
      case '"':
        escaped += "&quot;";
        break;
      case '\'':
        escaped += "&#39;";
        break;
      default:
        escaped += c;
    }
  }
  return escaped;
}

std::string groupedNumber(int64_t number) {
  std::string digits = std::to_string(number);
  const size_t first = number < 0 ? 1 : 0;
  for (size_t at = digits.size(); at > first + 3;) {
    at -= 3;
    digits.insert(at, 1, ',');
  }
  return digits;
}

std::string chartHTML(const Chart& chart) {
  if (chart.bars.empty()) return "";
  const std::string& first = chart.bars.front().label;
  const std::string& last = chart.bars.back().label;
  return fmt::format(
      "<figure><figcaption><h3>{}</h3><span class=\"most\">{}</span></figcaption>{}"
      "<div class=\"axis\"><span>{}</span><span>{}</span></div></figure>\n",
      escapedHTML(chart.title), escapedHTML(chart.most),
      svgHTML("chart", chart.title, kHeight, barsSVG(chart)), escapedHTML(first),
      first == last ? "" : escapedHTML(last));
}

std::string shareHTML(const std::vector<Share>& shares, double whole) {
  constexpr double kThick = 10;
  std::string parts;
  double x = 0;
  for (const Share& share : shares) {
    const double width = whole > 0 ? kWidth * share.value / whole : 0;
    if (width <= 0) continue;
    parts += fmt::format("<rect class=\"{}\" x=\"{:.2f}\" y=\"0\" width=\"{:.2f}\" height=\"{}\"/>",
                         share.style, x, width, kThick);
    x += width;
  }
  return svgHTML("share", "", kThick, parts);
}

std::string pageHTML(std::string_view title, std::string_view style, std::string_view body) {
  return fmt::format(
      "<!DOCTYPE html>\n<html lang=\"en\">\n<head>\n<meta charset=\"utf-8\">\n"
      "<meta http-equiv=\"Content-Security-Policy\" content=\"default-src 'none'; "
      "style-src '{}'; base-uri 'none'; form-action 'none'\">\n"
      "<meta name=\"viewport\" content=\"width=device-width, initial-scale=1\">\n"
      "<meta name=\"color-scheme\" content=\"light dark\">\n"
      "<meta name=\"referrer\" content=\"no-referrer\">\n"
      "<title>{}</title>\n<style>{}</style>\n</head>\n<body>\n{}</body>\n</html>\n",
      hashOf(style), escapedHTML(title), style, body);
}

}  // namespace cli
