#pragma once

#include <chrono>
#include <string>
#include <vector>

namespace cli {

// What became of a program of the system.
struct ProgramRun {
  enum class End { exited, notStarted, timedOut };
  End end = End::notStarted;
  // The exit status, or 128 plus the number of the signal that ended it; an errno value if the
  // program was not started.
  int status = 0;
  std::string output;  // standard output and error, at most kMaxProgramOutput bytes

  [[nodiscard]] bool succeeded() const { return end == End::exited && status == 0; }
};

inline constexpr size_t kMaxProgramOutput = size_t{64} << 10;

// Runs a program that $PATH finds, without input, and waits for its end. After `patience` it is
// killed; its own children are left alone.
[[nodiscard]] ProgramRun runProgram(const std::vector<std::string>& words,
                                    std::chrono::milliseconds patience);

}  // namespace cli
