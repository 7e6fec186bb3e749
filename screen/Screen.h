#pragma once

#include "cli/Options.h"

// Search as you type, on a terminal.
namespace mailscreen {

// Runs until the user leaves or a signal ends it, then restores the terminal. Waits for a daemon
// that is not running.
[[nodiscard]] cli::ExitStatus runScreen(const cli::Options& options);

}  // namespace mailscreen
