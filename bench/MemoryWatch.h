#pragma once

#include <sys/types.h>

#include <condition_variable>
#include <cstdint>
#include <thread>

#include "platform/Mutex.h"

namespace bench {

// Resident memory of a process, in bytes. The kernel counts a thread's pages in bulk, so that each
// figure may be off by some hundred kilobytes.
struct Memory {
  uint64_t anonymous = 0;      // RssAnon
  uint64_t anonymousPeak = 0;  // highest RssAnon seen, looked at every 20 ms
  uint64_t residentPeak = 0;   // VmHWM: mapped files count too
};

// Looks at the memory of one process every 20 ms. (What the kernel hands out about a child that has
// ended is no substitute: it counts in the memory of the parent that it was forked from.)
//
// Threads: one, the maker's. A sampling thread, joined by `stop`, shares `_memory` only. The
// process must not be waited for before `stop`: its number could go to another one.
class MemoryWatch {
 public:
  explicit MemoryWatch(pid_t process);
  ~MemoryWatch() { stop(); }
  MemoryWatch(const MemoryWatch&) = delete;
  MemoryWatch& operator=(const MemoryWatch&) = delete;

  // As of now; after `stop`, or the end of the process, as it was then.
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
