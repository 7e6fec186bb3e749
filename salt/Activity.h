#pragma once

#include <atomic>
#include <chrono>
#include <condition_variable>

#include "platform/Mutex.h"

namespace salt {

// Counts running operations of one kind, so that other work can give way to them. Any thread.
class Activity {
 public:
  // Operations that follow one another within `gap` count as one.
  explicit Activity(std::chrono::nanoseconds gap = {}) : _gap(gap) {}

  // Marks an operation as running for the lifetime of this object.
  class Work {
   public:
    explicit Work(Activity& activity) : _activity(activity) { activity.begin(); }
    ~Work() { _activity.end(); }
    Work(const Work&) = delete;
    Work& operator=(const Work&) = delete;

   private:
    Activity& _activity;
  };

  // Cheap: one relaxed load.
  [[nodiscard]] bool any() const { return _running.load(std::memory_order_relaxed) != 0; }

  // Waits until nothing has run for the length of the gap; at most `timeout`, and not after an
  // interruption.
  void waitForEnd(std::chrono::nanoseconds timeout) TL_EXCLUDES(_mutex);
  // Ends all waits, now and in future.
  void interrupt() TL_EXCLUDES(_mutex);

 private:
  void begin() TL_EXCLUDES(_mutex);
  void end() TL_EXCLUDES(_mutex);

  const std::chrono::nanoseconds _gap;
  std::atomic<int> _running{0};  // changed under the mutex
  platform::Mutex _mutex;
  std::condition_variable_any _changed;
  bool _interrupted TL_GUARDED_BY(_mutex) = false;
};

}  // namespace salt
