#pragma once

#include <string>
#include <string_view>

namespace cli {

// Text from outside made fit to be shown on one line of a terminal, as valid UTF-8: white space of
// any kind becomes a blank, other control characters (C0, DEL, C1) become U+FFFD, and characters
// that change the direction of the text around them (bidi embeddings, overrides and isolates) go.
[[nodiscard]] std::string cleanForTerminal(std::string_view text);

// As above, for text of several lines: line feeds stay.
[[nodiscard]] std::string cleanLinesForTerminal(std::string_view text);

// A JSON text whose strings hold any characters, with those that cleanForTerminal would not let
// through written as \u escapes. Invalid UTF-8 becomes U+FFFD.
[[nodiscard]] std::string escapeJSONForTerminal(std::string_view json);

// The beginning of a clean text that takes at most so many columns, with "…" at its end where
// something is cut off: wide characters take two, combining ones none. 0 columns are no limit.
[[nodiscard]] std::string fitted(std::string_view text, size_t columns);

// The columns that a clean text takes.
[[nodiscard]] size_t columnsTaken(std::string_view text);

// The columns of a terminal; 0 where the descriptor is none.
[[nodiscard]] size_t columnsOf(int descriptor);

enum class ColorMode { automatic, always, never };

// Whether to colour what goes to `descriptor`: by the mode, else on a terminal unless NO_COLOR is
// set and not empty, or TERM is "dumb".
[[nodiscard]] bool colorAllowed(ColorMode mode, int descriptor);

// Escape sequences, empty when colours are off.
struct Palette {
  explicit Palette(bool enabled)
      : rank(enabled ? "\x1b[2m" : ""),
        date(enabled ? "\x1b[32m" : ""),
        from(enabled ? "\x1b[36m" : ""),
        subject(enabled ? "\x1b[1m" : ""),
        match(enabled ? "\x1b[1;33m" : ""),
        faint(enabled ? "\x1b[2m" : ""),
        end(enabled ? "\x1b[0m" : "") {}

  const char* rank;
  const char* date;
  const char* from;
  const char* subject;
  const char* match;
  const char* faint;
  const char* end;
};

}  // namespace cli
