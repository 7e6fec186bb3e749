#pragma once

#include <condition_variable>
#include <cstddef>
#include <deque>
#include <optional>
#include <utility>

#include "platform/Mutex.h"

namespace cli {

// Maximum number of batches that wait for the sending thread, so that reading does not run far
// ahead.
inline constexpr size_t kQueuedBatches = 2;

// Passes batches from a thread that reads mail to the thread that sends it. One thread calls `push`
// and `end`, another `next` and `cancel`.
template <typename Batch>
class BatchQueue {
 public:
  // Waits for space; false if the queue has been cancelled.
  bool push(Batch batch) TL_EXCLUDES(_mutex) {
    {
      const platform::MutexLock lock(_mutex);
      while (_batches.size() >= kQueuedBatches && !_cancelled) _changed.wait(_mutex);
      if (_cancelled) return false;
      _batches.push_back(std::move(batch));
    }
    _changed.notify_all();
    return true;
  }

  // Call after the last batch.
  void end() TL_EXCLUDES(_mutex) {
    {
      const platform::MutexLock lock(_mutex);
      _ended = true;
    }
    _changed.notify_all();
  }

  // Waits for the next batch; nullopt after the last.
  [[nodiscard]] std::optional<Batch> next() TL_EXCLUDES(_mutex) {
    std::optional<Batch> batch;
    {
      const platform::MutexLock lock(_mutex);
      while (_batches.empty() && !_ended) _changed.wait(_mutex);
      if (_batches.empty()) return std::nullopt;
      batch = std::move(_batches.front());
      _batches.pop_front();
    }
    _changed.notify_all();
    return batch;
  }

  // The consumer wants no more batches.
  void cancel() TL_EXCLUDES(_mutex) {
    {
      const platform::MutexLock lock(_mutex);
      _cancelled = true;
    }
    _changed.notify_all();
  }

 private:
  platform::Mutex _mutex;
  std::condition_variable_any _changed;
  std::deque<Batch> _batches TL_GUARDED_BY(_mutex);
  bool _ended TL_GUARDED_BY(_mutex) = false;
  bool _cancelled TL_GUARDED_BY(_mutex) = false;
};

}  // namespace cli
