#pragma once

#include <sys/types.h>

#include <condition_variable>
#include <cstdint>
#include <string>
#include <thread>

#include "platform/Mutex.h"

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

// Resident memory of the daemon, in bytes. The kernel counts a thread's pages in bulk, so that each
// figure may be off by some hundred kilobytes.
struct Memory {
  uint64_t anonymous = 0;      // RssAnon
  uint64_t anonymousPeak = 0;  // highest RssAnon seen, looked at every 20 ms
  uint64_t residentPeak = 0;   // VmHWM: mapped files count too
};

// One tallowsearchd, taken from the directory of this program, on directories of its own. Its log
// goes to the file "daemon.log" in the scratch directory.
//
// Threads: one, the maker's. A sampling thread, joined by `stop`, shares `_memory` only. The daemon
// is killed when the program ends without `stop`.
class DaemonRun {
 public:
  // Returns once the daemon has said that it is ready; throws std::runtime_error when it does not.
  DaemonRun(const ScratchDirectory& scratch, const std::string& stateDirectory);
  ~DaemonRun();
  DaemonRun(const DaemonRun&) = delete;
  DaemonRun& operator=(const DaemonRun&) = delete;

  [[nodiscard]] const std::string& runtimeDirectory() const { return _runtimeDirectory; }

  [[nodiscard]] Memory memory() TL_EXCLUDES(_mutex);

  // Processor time of all its threads so far. Steadier than the clock on a machine with other work.
  [[nodiscard]] double cpuSeconds() const;

  // Asks the daemon to end and waits until it has; throws unless it ended well.
  void stop();

 private:
  void spawn(const std::string& stateDirectory, const std::string& notifyPath,
             const std::string& logPath);
  void awaitReady(int notifySocket) const;
  void lookAtMemory() TL_REQUIRES(_mutex);
  void sampleMemory() TL_EXCLUDES(_mutex);
  void endSampling();
  // The exit status, as waitpid gives it.
  int end(int signal);

  const std::string _runtimeDirectory;
  pid_t _pid = -1;  // fixed while the sampling thread runs

  platform::Mutex _mutex;
  std::condition_variable_any _changed;
  Memory _memory TL_GUARDED_BY(_mutex);
  bool _ending TL_GUARDED_BY(_mutex) = false;
  std::thread _sampler;
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
