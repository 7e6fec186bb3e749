#pragma once

#include <CLI/CLI.hpp>
#include <string>
#include <vector>

namespace cli {

// The command line, of which the first is the program, with the command in front, so that its
// options may stand before it as well. The minus of a word to search for, such as -draft, is
// replaced by a control character, since it would be taken for options; see restoreWords.
[[nodiscard]] std::vector<std::string> commandFirst(int argc, const char* const* argv,
                                                    const CLI::App& app);
void restoreWords(std::vector<std::string>& words);

}  // namespace cli
