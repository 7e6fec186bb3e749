#pragma once

#include <string>

#include "cli/Options.h"

namespace cli {

// The examples at the end of a command's help; empty if the synopsis is enough.
[[nodiscard]] std::string examplesOf(Command command);

}  // namespace cli
