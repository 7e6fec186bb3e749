#include "cli/Terminal.h"

#include <fmt/format.h>
#include <sys/ioctl.h>
#include <unicode/uchar.h>
#include <unicode/utf16.h>
#include <unistd.h>

#include <cstdlib>

#include "platform/Text.h"

namespace cli {

namespace {

constexpr char16_t kReplacement = 0xFFFD;

bool isControl(UChar32 c) {
  return c < 0x20 || (c >= 0x7F && c < 0xA0);
}

bool changesDirection(UChar32 c) {
  return (c >= 0x202A && c <= 0x202E) || (c >= 0x2066 && c <= 0x2069);
}

size_t widthOf(UChar32 c) {
  const uint32_t mask = U_GET_GC_MASK(c);
  if ((mask & (U_GC_MN_MASK | U_GC_ME_MASK | U_GC_CF_MASK)) != 0) return 0;
  const int32_t width = u_getIntPropertyValue(c, UCHAR_EAST_ASIAN_WIDTH);
  return width == U_EA_FULLWIDTH || width == U_EA_WIDE ? 2 : 1;
}

std::string clean(std::string_view text, bool keepLines) {
  const TLString units = platform::fromUTF8(text);
  TLString out;
  out.reserve(units.size());
  for (size_t i = 0; i < units.size();) {
    UChar32 c;
    U16_NEXT(units.data(), i, units.size(), c);
    if (c == '\n' && keepLines) {
      out.push_back(u'\n');
    } else if (u_isUWhiteSpace(c)) {
      out.push_back(u' ');
    } else if (isControl(c)) {
      out.push_back(kReplacement);
    } else if (!changesDirection(c)) {
      out.append(units, i - static_cast<size_t>(U16_LENGTH(c)), U16_LENGTH(c));
    }
  }
  return platform::toUTF8(out);
}

}  // namespace

std::string cleanForTerminal(std::string_view text) {
  return clean(text, false);
}

std::string cleanLinesForTerminal(std::string_view text) {
  return clean(text, true);
}

std::string escapeJSONForTerminal(std::string_view json) {
  const TLString units = platform::fromUTF8(json);
  std::string out;
  out.reserve(json.size());
  size_t done = 0;
  for (size_t i = 0; i < units.size(); ++i) {
    // Keeps the line feeds of the layout; those in strings are already escaped.
    const char16_t c = units[i];
    if (c == '\n' || !(isControl(c) || changesDirection(c))) continue;
    platform::appendUTF8(TLStringView(units).substr(done, i - done), out);
    fmt::format_to(std::back_inserter(out), "\\u{:04x}", static_cast<unsigned>(c));
    done = i + 1;
  }
  platform::appendUTF8(TLStringView(units).substr(done), out);
  return out;
}

std::string fitted(std::string_view text, size_t columns) {
  if (columns == 0) return std::string(text);
  const TLString units = platform::fromUTF8(text);
  size_t used = 0;
  size_t fits = 0;  // where the ellipsis would go
  for (size_t i = 0; i < units.size();) {
    UChar32 c;
    const size_t at = i;
    U16_NEXT(units.data(), i, units.size(), c);
    used += widthOf(c);
    if (used > columns) return platform::toUTF8(TLStringView(units).substr(0, fits)) + "…";
    if (used < columns) fits = i;
    if (used == columns && widthOf(c) > 0) fits = at;
  }
  return std::string(text);
}

size_t columnsTaken(std::string_view text) {
  const TLString units = platform::fromUTF8(text);
  size_t columns = 0;
  for (size_t i = 0; i < units.size();) {
    UChar32 c;
    U16_NEXT(units.data(), i, units.size(), c);
    columns += widthOf(c);
  }
  return columns;
}

size_t columnsOf(int descriptor) {
  winsize size{};
  return isatty(descriptor) == 1 && ioctl(descriptor, TIOCGWINSZ, &size) == 0 ? size.ws_col : 0;
}

bool colorAllowed(ColorMode mode, int descriptor) {
  if (mode != ColorMode::automatic) return mode == ColorMode::always;
  const char* noColor = std::getenv("NO_COLOR");
  if (noColor != nullptr && *noColor != '\0') return false;
  const char* terminal = std::getenv("TERM");
  const bool dumb = terminal == nullptr || std::string_view(terminal) == "dumb";
  return !dumb && isatty(descriptor) == 1;
}

}  // namespace cli
