#pragma once

#include <string>
#include <string_view>
#include <vector>

namespace cli {

// Puts `begin` and `end` around the words of `text` that begin with one of the words of a query,
// without regard to case and accents. The text is clean UTF-8.
[[nodiscard]] std::string highlight(std::string_view text, const std::vector<std::string>& words,
                                    std::string_view begin, std::string_view end);

// The part of a text of several lines, at most so many characters and on one line, that holds the
// most different words of a query, with "…" where something is left out. Empty where it holds none.
[[nodiscard]] std::string passageOf(std::string_view text, const std::vector<std::string>& words,
                                    size_t characters);

// Whether a word of the text is marked by `highlight`.
[[nodiscard]] bool holdsWord(std::string_view text, const std::vector<std::string>& words);

// The words of what a user typed, as `highlight` takes them.
[[nodiscard]] std::vector<std::string> queryWords(std::string_view query);

}  // namespace cli
