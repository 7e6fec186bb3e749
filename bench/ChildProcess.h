#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <utility>
#include <vector>

// Runs programs to their end and measures them.
namespace bench {

using Variables = std::vector<std::pair<std::string, std::string>>;

// This process's environment with some variables replaced; entries are "NAME=VALUE".
[[nodiscard]] std::vector<std::string> environmentWith(const Variables& values);

// The path of a program in the directory of this one.
[[nodiscard]] std::string programBeside(const std::string& name);

struct Command {
  std::vector<std::string>
      arguments;        // the program is searched for in PATH unless it contains a slash
  Variables variables;  // added to this process's environment
  std::string output;   // file for standard output, overwritten
  std::vector<int> goodStatuses = {0};
};

// Where the standard error of a command goes.
[[nodiscard]] std::string errorsOf(const Command& command);

struct Run {
  double seconds;         // wall time from start to end
  double cpuSeconds;      // of all its threads
  uint64_t residentPeak;  // VmHWM in bytes, sampled every 20 ms; 0 without sampling
};

// `watchMemory` would disturb a program that takes only milliseconds. Throws if the program cannot
// be run, is killed or has another exit status; the message contains what it wrote to standard
// error.
Run runProgram(const Command& command, bool watchMemory);

// The last word of the first line that `program --version` prints; nullopt if it is not installed.
[[nodiscard]] std::optional<std::string> versionOf(const std::string& program,
                                                   const std::string& outputFile);

}  // namespace bench
