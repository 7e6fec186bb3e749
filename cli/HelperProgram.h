#pragma once

#include <string>

#include "cli/Options.h"

namespace cli {

// The path of a program of ours that only `tallow` runs: in the directory of this program, as in a
// build, or where it is installed.
[[nodiscard]] std::string helperProgramPath(const char* name);

// The path of tallow-extract; empty if the text of attachments is not wanted, by the command line
// or else by `setting`, or if the program is not installed.
[[nodiscard]] std::string extractProgram(const Options& options, bool setting);

}  // namespace cli
