#pragma once

#include <atomic>
#include <chrono>
#include <condition_variable>

#include "platform/Mutex.h"

namespace salt {

// The scans that run at a moment, for background work that gives way to them. Any thread.
class ScanTraffic {
 public:
  // As long as one lives a scan runs.
  class Scan {
   public:
    explicit Scan(ScanTraffic& traffic) : _traffic(traffic) { traffic.begin(); }
    ~Scan() { _traffic.end(); }
    Scan(const Scan&) = delete;
    Scan& operator=(const Scan&) = delete;

   private:
    ScanTraffic& _traffic;
  };

  // Cheap enough to ask all the time.
  [[nodiscard]] bool any() const { return _running.load(std::memory_order_relaxed) != 0; }

  // Waits for the end of all scans, and for a moment more, since one search makes several; no
  // longer than `most`.
  void waitForEnd(std::chrono::nanoseconds most) TL_EXCLUDES(_mutex);

 private:
  void begin() TL_EXCLUDES(_mutex);
  void end() TL_EXCLUDES(_mutex);

  std::atomic<int> _running{0};  // changed under the mutex
  platform::Mutex _mutex;
  std::condition_variable_any _changed;
};

}  // namespace salt
