#pragma once

#include <sys/types.h>

#include <cstdint>

#include "bench/ChildProcess.h"

namespace bench {

// A program that runs beside this one, and ends with it at the latest. One thread.
class RunningProgram {
 public:
  // Throws when the system gives no process; a program that is not there is noticed by `stop`. The
  // standard error goes where that of runProgram goes.
  explicit RunningProgram(const Command& command);
  // Kills it where it still runs.
  ~RunningProgram();
  RunningProgram(const RunningProgram&) = delete;
  RunningProgram& operator=(const RunningProgram&) = delete;

  [[nodiscard]] pid_t pid() const { return _pid; }
  // Of all its threads so far.
  [[nodiscard]] double cpuSeconds() const;
  // How often its main thread has gone to sleep and so been woken, as far as the kernel tells.
  [[nodiscard]] uint64_t sleeps() const;

  // Asks it to end, and waits; throws unless it ends with a good status.
  void stop();

 private:
  int end(int signal);

  const Command _command;
  pid_t _pid = -1;
};

}  // namespace bench
