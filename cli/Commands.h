#pragma once

#include <string>

#include "cli/Options.h"
#include "platform/TLError.h"

namespace cli {

// Carries out one command: its result goes to the standard output, all else to the standard error.
[[nodiscard]] ExitStatus runCommand(const Options& options);

// Of runCommand, the one that reads mail.
[[nodiscard]] ExitStatus runIndex(const Options& options);

// Says "tallow: MESSAGE" on the standard error.
void complain(const std::string& message);

// The same for an error; the status that goes with it.
ExitStatus complain(const std::optional<TLError>& error);

}  // namespace cli
