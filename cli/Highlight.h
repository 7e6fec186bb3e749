#pragma once

#include <string>
#include <string_view>
#include <vector>

namespace cli {

// Puts `begin` and `end` around each word of `text` that begins with a word of the query, ignoring
// case and accents. The text is clean UTF-8.
[[nodiscard]] std::string highlight(std::string_view text, const std::vector<std::string>& words,
                                    std::string_view begin, std::string_view end);

// The passage of a text that contains the most different words of a query, on one line and at most
// `characters` long, with "…" for omitted text. Empty if no word occurs.
[[nodiscard]] std::string passageOf(std::string_view text, const std::vector<std::string>& words,
                                    size_t characters);

// Whether `highlight` would mark a word of the text.
[[nodiscard]] bool holdsWord(std::string_view text, const std::vector<std::string>& words);

// The words of a typed query, in the form that `highlight` takes.
[[nodiscard]] std::vector<std::string> queryWords(std::string_view query);

}  // namespace cli
