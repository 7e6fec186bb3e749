#pragma once

#include <condition_variable>
#include <functional>
#include <optional>
#include <stop_token>
#include <string>
#include <thread>
#include <utility>

#include "platform/Mutex.h"
#include "platform/Queue.h"

namespace platform {

// A thread that runs one job at a time, and only the latest matters. A new job replaces a waiting
// one and stops the current one, whose result is dropped.
//
// `submit` and `take` belong to the owner's thread and do not wait. `work` and `wake`, which
// announces a result, run on the worker's thread. The destructor stops the current job and waits
// for it.
template <typename Job, typename Result>
class LatestWorker {
 public:
  using Work = std::function<Result(const Job& job, const std::stop_token& stop)>;

  LatestWorker(std::string threadName, Work work, std::function<void()> wake)
      : _work(std::move(work)), _wake(std::move(wake)) {
    _thread = std::thread([this, name = std::move(threadName)] {
      setThreadName(name);
      run();
    });
  }
  ~LatestWorker() {
    {
      const MutexLock lock(_mutex);
      _ending = true;
      _stop.request_stop();
    }
    _changed.notify_one();
    _thread.join();
  }
  LatestWorker(const LatestWorker&) = delete;
  LatestWorker& operator=(const LatestWorker&) = delete;

  void submit(Job job) TL_EXCLUDES(_mutex) {
    {
      const MutexLock lock(_mutex);
      _waiting = std::move(job);
      _done.reset();
      _stop.request_stop();
    }
    _changed.notify_one();
  }

  // The result of the last job, once.
  [[nodiscard]] std::optional<Result> take() TL_EXCLUDES(_mutex) {
    const MutexLock lock(_mutex);
    return std::exchange(_done, std::nullopt);
  }

 private:
  void run() TL_EXCLUDES(_mutex) {
    std::stop_token stop;
    while (const auto job = next(stop)) {
      Result result = _work(*job, stop);
      if (keep(std::move(result), stop)) _wake();
    }
  }

  std::optional<Job> next(std::stop_token& stop) TL_EXCLUDES(_mutex) {
    const MutexLock lock(_mutex);
    while (!_waiting && !_ending) _changed.wait(_mutex);
    if (_ending) return std::nullopt;
    _stop = std::stop_source();
    stop = _stop.get_token();
    return std::exchange(_waiting, std::nullopt);
  }

  bool keep(Result result, const std::stop_token& stop) TL_EXCLUDES(_mutex) {
    const MutexLock lock(_mutex);
    if (stop.stop_requested()) return false;
    _done = std::move(result);
    return true;
  }

  const Work _work;
  const std::function<void()> _wake;
  Mutex _mutex;
  std::condition_variable_any _changed;
  std::optional<Job> _waiting TL_GUARDED_BY(_mutex);
  std::optional<Result> _done TL_GUARDED_BY(_mutex);
  std::stop_source _stop TL_GUARDED_BY(_mutex);  // of the current job
  bool _ending TL_GUARDED_BY(_mutex) = false;
  std::thread _thread;  // "tallow.searcher" and the like; joined by the destructor
};

}  // namespace platform
