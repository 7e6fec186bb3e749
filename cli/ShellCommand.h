#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

namespace cli {

// Starts a command as a shell reads it, with these arguments as "$1" and so on, `input` as its
// standard input, and all signals as a program expects them, whatever this one ignores or blocks.
// 0, or an errno value.
[[nodiscard]] int startShell(const std::string& command, const std::vector<std::string>& arguments,
                             int input, pid_t& process);

}  // namespace cli
