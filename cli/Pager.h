#pragma once

#include <string_view>

#include "cli/Options.h"

namespace cli {

// Writes a text through the user's pager if the standard output is a terminal: $PAGER, by default
// less -R. Writes it directly if it is not a terminal, if $PAGER is empty or cat, or if the pager
// does not exist. The text must be clean. Leaving the pager before the end is not a failure.
[[nodiscard]] ExitStatus page(std::string_view text);

}  // namespace cli
