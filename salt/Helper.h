#pragma once

#include <atomic>
#include <functional>
#include <latch>
#include <memory>

#include "platform/Queue.h"

namespace salt {

// A thread that takes over half of a short job, if it gets to it in time: waking a thread can take
// longer than the job, and nobody waits for one that has not begun. Any thread.
class Helper {
 public:
  // Runs half(0) here and half(1) on the helper's thread, at the same time. half(1) is left out
  // when half(0) has ended before it began, or no thread can be had, so each half does what the
  // other has not done yet.
  void share(const std::function<void(size_t half)>& half) {
    const auto job = std::make_shared<Job>();
    const bool begun = _thread.async([job, &half] {
      if (job->taken.exchange(true)) return;
      half(1);
      job->done.count_down();
    });
    half(0);
    if (begun && job->taken.exchange(true)) job->done.wait();
  }

 private:
  struct Job {
    std::atomic<bool> taken{false};
    std::latch done{1};
  };

  platform::SerialQueue _thread{"tallow-scan"};
};

}  // namespace salt
