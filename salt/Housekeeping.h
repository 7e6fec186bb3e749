#pragma once

#include <chrono>
#include <condition_variable>

#include "platform/Mutex.h"

namespace salt {

// The merges and compactions that run at a moment, for those who add a lot and wait meanwhile. Any
// thread.
class Housekeeping {
 public:
  // As long as one lives, work goes on.
  class Work {
   public:
    explicit Work(Housekeeping& house) : _house(house) { house.begin(); }
    ~Work() { _house.end(); }
    Work(const Work&) = delete;
    Work& operator=(const Work&) = delete;

   private:
    Housekeeping& _house;
  };

  // No longer than `most`.
  void waitForEnd(std::chrono::nanoseconds most) TL_EXCLUDES(_mutex);

 private:
  void begin() TL_EXCLUDES(_mutex);
  void end() TL_EXCLUDES(_mutex);

  platform::Mutex _mutex;
  std::condition_variable_any _ended;
  int _running TL_GUARDED_BY(_mutex) = 0;
};

}  // namespace salt
