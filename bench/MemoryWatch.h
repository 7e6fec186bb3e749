#pragma once

#include <sys/types.h>

#include <condition_variable>
#include <cstdint>
#include <string_view>
#include <thread>

#include "platform/Mutex.h"

namespace bench {

// Resident memory of a process in bytes. The kernel updates its counters in batches, so each value
// may be off by a few hundred kilobytes.
struct Memory {
  uint64_t anonymous = 0;      // RssAnon
  uint64_t anonymousPeak = 0;  // highest RssAnon, sampled every 20 ms
  uint64_t residentPeak = 0;   // VmHWM, which includes mapped files
};

// The number in the line of /proc/PID/status that begins with `field`; 0 where there is none.
[[nodiscard]] uint64_t statusNumber(pid_t process, std::string_view field);

// Samples the memory of one process every 20 ms. (The kernel's figures for a child that has ended
// are unsuitable: they include the memory of the parent before the fork.)
//
// Threads: used by one. A sampling thread, joined by `stop`, shares only `_memory`. The process
// must not be reaped before `stop`, because its PID could be reused.
class MemoryWatch {
 public:
  explicit MemoryWatch(pid_t process);
  ~MemoryWatch() { stop(); }
  MemoryWatch(const MemoryWatch&) = delete;
  MemoryWatch& operator=(const MemoryWatch&) = delete;

  // The current value; after `stop` or the end of the process, the last one.
  [[nodiscard]] Memory memory() TL_EXCLUDES(_mutex);

  void stop() TL_EXCLUDES(_mutex);

 private:
  void look() TL_REQUIRES(_mutex);
  void sample() TL_EXCLUDES(_mutex);

  const pid_t _process;
  platform::Mutex _mutex;
  std::condition_variable_any _changed;
  Memory _memory TL_GUARDED_BY(_mutex);
  bool _ending TL_GUARDED_BY(_mutex) = false;
  std::thread _sampler;
};

}  // namespace bench
