#pragma once

#include <string>
#include <string_view>

namespace cli {

// Makes untrusted text safe for one line of a terminal, as valid UTF-8: any white space becomes a
// space, other control characters (C0, DEL, C1) become U+FFFD, and characters that change the
// direction of the surrounding text (bidi embeddings, overrides and isolates) are removed.
[[nodiscard]] std::string cleanForTerminal(std::string_view text);

// As above for text of several lines: line feeds are kept.
[[nodiscard]] std::string cleanLinesForTerminal(std::string_view text);

// Makes a JSON text safe for a terminal: characters in its strings that cleanForTerminal would
// change are written as \u escapes. Invalid UTF-8 becomes U+FFFD.
[[nodiscard]] std::string escapeJSONForTerminal(std::string_view json);

// The longest prefix of a clean text that fits into `columns`, ending with "…" if something is cut
// off. Wide characters take two columns, combining ones none. 0 columns mean no limit.
[[nodiscard]] std::string fitted(std::string_view text, size_t columns);

// The width of a clean text in columns.
[[nodiscard]] size_t columnsTaken(std::string_view text);

// The width of a terminal in columns; 0 if the descriptor is not a terminal.
[[nodiscard]] size_t columnsOf(int descriptor);

enum class ColorMode { automatic, always, never };

// Whether to use colours on `descriptor`: according to the mode; in automatic mode, if it is a
// terminal, unless NO_COLOR is set and not empty, or TERM is "dumb".
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
