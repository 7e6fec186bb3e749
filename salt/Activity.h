#pragma once

#include <atomic>
#include <chrono>
#include <condition_variable>

#include "platform/Mutex.h"

namespace salt {

// How much work of one kind goes on at a moment, for other work that gives way to it. Any thread.
class Activity {
 public:
  // Pieces of work that follow one another within `gap` count as one.
  explicit Activity(std::chrono::nanoseconds gap = {}) : _gap(gap) {}

  // As long as one lives, work goes on.
  class Work {
   public:
    explicit Work(Activity& activity) : _activity(activity) { activity.begin(); }
    ~Work() { _activity.end(); }
    Work(const Work&) = delete;
    Work& operator=(const Work&) = delete;

   private:
    Activity& _activity;
  };

  // Cheap enough to ask all the time.
  [[nodiscard]] bool any() const { return _running.load(std::memory_order_relaxed) != 0; }

  // Waits until no work has gone on for the length of the gap; no longer than `most`, and not after
  // an interruption.
  void waitForEnd(std::chrono::nanoseconds most) TL_EXCLUDES(_mutex);
  // Ends all waiting, for good.
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
