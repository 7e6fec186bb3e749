#pragma once

#include <sys/types.h>

#include <cstdint>
#include <optional>
#include <string>

#include "bench/MemoryWatch.h"

// What the end-to-end benchmarks share: a daemon of their own, and figures.
namespace bench {

// A fresh directory that is gone, with all in it, at the end.
class ScratchDirectory {
 public:
  ScratchDirectory();
  ~ScratchDirectory();
  ScratchDirectory(const ScratchDirectory&) = delete;
  ScratchDirectory& operator=(const ScratchDirectory&) = delete;

  [[nodiscard]] std::string operator/(const std::string& name) const { return _path + '/' + name; }

 private:
  std::string _path;
};

// One tallowsearchd, taken from the directory of this program, on directories of its own. Its log
// goes to the file "daemon.log" in the scratch directory.
//
// Threads: one, the maker's. The daemon is killed when the program ends without `stop`.
class DaemonRun {
 public:
  // Returns once the daemon has said that it is ready; throws std::runtime_error when it does not.
  DaemonRun(const ScratchDirectory& scratch, const std::string& stateDirectory);
  ~DaemonRun();
  DaemonRun(const DaemonRun&) = delete;
  DaemonRun& operator=(const DaemonRun&) = delete;

  [[nodiscard]] const std::string& runtimeDirectory() const { return _runtimeDirectory; }

  [[nodiscard]] Memory memory() { return _watch->memory(); }

  // Processor time of all its threads so far. Steadier than the clock on a machine with other work.
  [[nodiscard]] double cpuSeconds() const;

  // How many threads and open descriptors it has now.
  [[nodiscard]] size_t threads() const { return countEntries("task"); }
  [[nodiscard]] size_t descriptors() const { return countEntries("fd"); }

  // The kernel's number of its thread of this name; none when there is no such thread now.
  [[nodiscard]] std::optional<pid_t> threadNamed(const std::string& name) const;

  // Asks the daemon to end and waits until it has; throws unless it ended well.
  void stop();

 private:
  void spawn(const std::string& stateDirectory, const std::string& notifyPath,
             const std::string& logPath);
  void awaitReady(int notifySocket) const;
  // In a directory of /proc/PID.
  [[nodiscard]] size_t countEntries(const char* directory) const;
  // The exit status, as waitpid gives it.
  int end(int signal);

  const std::string _runtimeDirectory;
  pid_t _pid = -1;
  std::optional<MemoryWatch> _watch;
};

// Sum of what the files at and below `path` take on the disk, in bytes.
[[nodiscard]] uint64_t bytesOnDisk(const std::string& path);

// Seconds since some moment of the past.
[[nodiscard]] double secondsNow();

// Processor time of all threads of this process.
[[nodiscard]] double cpuSecondsNow();

// Calls `run`; an exception becomes a message and the exit status 1.
[[nodiscard]] int guarded(const char* program, int (*run)(int, char**), int argc, char** argv);

}  // namespace bench
