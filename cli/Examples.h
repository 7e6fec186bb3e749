#pragma once

#include <string>

#include "cli/Options.h"

namespace cli {

// What stands at the end of a command's help; empty where the synopsis says it all.
[[nodiscard]] std::string examplesOf(Command command);

}  // namespace cli
