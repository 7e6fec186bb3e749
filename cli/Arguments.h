#pragma once

#include <CLI/CLI.hpp>
#include <string>
#include <vector>

namespace cli {

// The arguments after the program's name, with the command moved to the front, because options may
// also stand before it. The minus of a word such as -draft is replaced by a control character,
// because it would be read as options; see restoreWords.
[[nodiscard]] std::vector<std::string> commandFirst(int argc, const char* const* argv,
                                                    const CLI::App& app);
void restoreWords(std::vector<std::string>& words);

}  // namespace cli
