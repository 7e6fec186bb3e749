#pragma once

#include <string_view>

#include "cli/Options.h"

namespace cli {

// Writes a text through the user's pager where the standard output is a terminal: by $PAGER, else
// less -R. Plain where it is none, where $PAGER is empty or cat, and where there is no such
// program. The text is clean. A pager that is left before the end is no failure.
[[nodiscard]] ExitStatus page(std::string_view text);

}  // namespace cli
