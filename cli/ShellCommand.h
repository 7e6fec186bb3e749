#pragma once

#include <sys/types.h>

#include <optional>
#include <string>
#include <vector>

namespace cli {

// Starts a shell command with `arguments` as "$1" and so on, `input` as its standard input, and
// default signal handling, whatever this process ignores or blocks. Returns 0 or an errno value.
[[nodiscard]] int startShell(const std::string& command, const std::vector<std::string>& arguments,
                             int input, pid_t& process);

// The shell command that opens the mail file "$1", made of $TALLOW_OPEN; nullopt if that names no
// program.
[[nodiscard]] std::optional<std::string> openingCommand();

}  // namespace cli
