#pragma once

#include "cli/Options.h"

// `tallow mcp`: serves search and reading of mail over the Model Context Protocol, on the standard
// input and output.
namespace mcp {

// Serves until the input ends or the output is closed. Fails at once if no folder is named, in the
// options or in the settings.
[[nodiscard]] cli::ExitStatus runServer(const cli::Options& options);

}  // namespace mcp
