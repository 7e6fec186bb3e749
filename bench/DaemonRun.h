#pragma once

#include <sys/types.h>

#include <cstdint>
#include <optional>
#include <string>

#include "bench/MemoryWatch.h"

// Runs a daemon for the end-to-end benchmarks and measures it.
namespace bench {

// A new directory, removed with its contents at the end.
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

// One tallowsearchd from the directory of this program, with its own directories. Its log is the
// file "daemon.log" in the scratch directory.
//
// Threads: used by one. The daemon is killed if the object is destroyed without `stop`.
class DaemonRun {
 public:
  // Returns when the daemon has reported that it is ready; throws std::runtime_error if it does
  // not.
  DaemonRun(const ScratchDirectory& scratch, const std::string& stateDirectory);
  ~DaemonRun();
  DaemonRun(const DaemonRun&) = delete;
  DaemonRun& operator=(const DaemonRun&) = delete;

  [[nodiscard]] const std::string& runtimeDirectory() const { return _runtimeDirectory; }

  [[nodiscard]] Memory memory() { return _watch->memory(); }

  // Processor time of all its threads so far; less noisy than wall time on a busy machine.
  [[nodiscard]] double cpuSeconds() const;

  // The current number of threads and of open descriptors.
  [[nodiscard]] size_t threads() const { return countEntries("task"); }
  [[nodiscard]] size_t descriptors() const { return countEntries("fd"); }

  // The thread ID of its thread with this name; nullopt if there is none now.
  [[nodiscard]] std::optional<pid_t> threadNamed(const std::string& name) const;

  // Asks the daemon to end and waits; throws if it fails.
  void stop();

 private:
  void spawn(const std::string& stateDirectory, const std::string& notifyPath,
             const std::string& logPath);
  void awaitReady(int notifySocket) const;
  // In a directory of /proc/PID.
  [[nodiscard]] size_t countEntries(const char* directory) const;
  // Returns the status from waitpid.
  int end(int signal);

  const std::string _runtimeDirectory;
  pid_t _pid = -1;
  std::optional<MemoryWatch> _watch;
};

// Total disk space of the files in `path`, in bytes.
[[nodiscard]] uint64_t bytesOnDisk(const std::string& path);

// Monotonic seconds.
[[nodiscard]] double secondsNow();

// Processor time of all threads of a process, and of this one.
[[nodiscard]] double cpuSecondsOf(pid_t process);
[[nodiscard]] double cpuSecondsNow();

// Calls `run`; turns an exception into a message and exit status 1.
[[nodiscard]] int guarded(const char* program, int (*run)(int, char**), int argc, char** argv);

}  // namespace bench
