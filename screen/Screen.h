#pragma once

#include "cli/Options.h"

// Search as you type, on a terminal.
namespace mailscreen {

// Runs until the user leaves, or a signal asks for the end; then the terminal is as it was before.
// A daemon that is not there is waited for.
[[nodiscard]] cli::ExitStatus runScreen(const cli::Options& options);

}  // namespace mailscreen
