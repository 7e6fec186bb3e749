#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <utility>
#include <vector>

// Programs that are run to their end, and what that took.
namespace bench {

using Variables = std::vector<std::pair<std::string, std::string>>;

// This process's environment with some variables set anew, as texts "NAME=VALUE".
[[nodiscard]] std::vector<std::string> environmentWith(const Variables& values);

// A program of this name in the directory of this one.
[[nodiscard]] std::string programBeside(const std::string& name);

struct Command {
  std::vector<std::string> arguments;  // the first is looked for in PATH unless it has a slash
  Variables variables;                 // set anew in this process's environment
  std::string output;                  // file for the standard output, which is replaced
  std::vector<int> goodStatuses = {0};
};

struct Run {
  double seconds;         // from before its start until it has ended
  double cpuSeconds;      // of all its threads
  uint64_t residentPeak;  // VmHWM, looked at every 20 ms, in bytes; 0 when nobody looked
};

// A program of some milliseconds would feel the look at its memory. Throws when the program cannot
// be run, is killed or has another exit status; what it wrote to the standard error is in the
// message.
Run runProgram(const Command& command, bool watchMemory);

// The last word of the first line that `program --version` prints; none when it is not installed.
[[nodiscard]] std::optional<std::string> versionOf(const std::string& program,
                                                   const std::string& outputFile);

}  // namespace bench
