#pragma once

#include <condition_variable>
#include <deque>
#include <functional>
#include <string>
#include <thread>

#include "platform/Mutex.h"

namespace platform {

enum class QueuePriority { unspecified, background };

// A serial queue on a thread of its own: items run one after the other in order of submission.
//
// Threads: any thread may submit. `sync` must not be called from an item of the same queue, as it
// would wait for itself. The destructor runs what is queued, then joins the thread; it must not run
// on it.
class SerialQueue {
 public:
  using Item = std::function<void()>;

  // The thread bears the last 15 bytes of `name`, the longest that Linux keeps.
  explicit SerialQueue(std::string name, QueuePriority priority = QueuePriority::unspecified);
  ~SerialQueue();
  SerialQueue(const SerialQueue&) = delete;
  SerialQueue& operator=(const SerialQueue&) = delete;

  [[nodiscard]] const std::string& name() const { return _name; }

  // Submits and returns at once.
  void async(Item item);

  // Submits and returns when the item, and all before it, have run.
  void sync(const Item& item);

  // Returns when everything submitted before has run.
  void drain() {
    sync([] {});
  }

 private:
  void run();

  const std::string _name;
  const QueuePriority _priority;
  Mutex _mutex;
  std::condition_variable_any _changed;
  std::deque<Item> _items TL_GUARDED_BY(_mutex);
  bool _ending TL_GUARDED_BY(_mutex) = false;
  std::thread _thread;
};

// Names the calling thread by the last 15 bytes of `name`.
void setThreadName(const std::string& name);

// From here on the calling thread leaves the processors to threads of ordinary priority as long as
// these have work, but for a tenth.
void lowerThreadPriority();

}  // namespace platform
