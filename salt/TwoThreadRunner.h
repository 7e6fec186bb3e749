#pragma once

#include <atomic>
#include <functional>
#include <latch>
#include <memory>

#include "platform/Queue.h"

namespace salt {

// Splits a short job between the calling thread and a second one, which takes its half if it wakes
// up in time: waking a thread can take longer than the job, and nobody waits for a half that has
// not begun. Any thread.
class TwoThreadRunner {
 public:
  // Runs half(0) on the calling thread and half(1) concurrently on the second thread. half(1) is
  // skipped if half(0) ends before it begins, or if no thread is available, so each half must
  // process whatever the other has not.
  void run(const std::function<void(size_t half)>& half) {
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
