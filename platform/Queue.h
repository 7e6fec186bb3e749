#pragma once

#include <chrono>
#include <condition_variable>
#include <deque>
#include <functional>
#include <string>
#include <thread>

#include "platform/Mutex.h"

namespace platform {

// Of the queue's thread: as any, as work in batches, or giving way to all others.
enum class QueuePriority { unspecified, background, low };

// A serial queue: items run one at a time, in order of submission. Items of `async` run on a thread
// that the queue starts when there is something to run and that ends once the queue has been idle
// for a while; items of `sync` run on the calling thread, so that they need no other.
//
// Threads: any thread may submit. `sync` must not be called from an item of the same queue, as it
// would wait for itself. The destructor runs what is queued, then joins the thread; it must not run
// on it.
class SerialQueue {
 public:
  using Item = std::function<void()>;

  static constexpr std::chrono::milliseconds kIdle{2000};
  static constexpr std::chrono::milliseconds kForever{std::chrono::milliseconds::max()};

  // The thread bears the last 15 bytes of `name`, the longest that Linux keeps, and ends after
  // `idle` without an item.
  explicit SerialQueue(std::string name, QueuePriority priority = QueuePriority::unspecified,
                       std::chrono::milliseconds idle = kIdle);
  ~SerialQueue();
  SerialQueue(const SerialQueue&) = delete;
  SerialQueue& operator=(const SerialQueue&) = delete;

  [[nodiscard]] const std::string& name() const { return _name; }

  // Starts the thread ahead of the first item. False when the system has no thread to give. A queue
  // with kForever that has been started cannot fail to take an item.
  [[nodiscard]] bool start() TL_EXCLUDES(_mutex);

  // Submits and returns at once. False when a thread is needed and the system has none to give: the
  // item is destroyed without having run.
  [[nodiscard]] bool async(Item item) TL_EXCLUDES(_mutex);

  // async, or sync where the system has no thread to give. Not from an item of the same queue.
  void submit(const Item& item) TL_EXCLUDES(_mutex) {
    if (!async(item)) sync(item);
  }

  // Runs the item on this thread, once all before it have run. Cannot fail.
  void sync(const Item& item) TL_EXCLUDES(_mutex);

  // Returns when everything submitted before has run.
  void drain() {
    sync([] {});
  }

 private:
  // An item of the thread, or the place in the line of a caller of `sync`.
  struct Entry {
    Item item;
    const void* caller = nullptr;
  };

  bool startThread() TL_REQUIRES(_mutex);
  void run() TL_EXCLUDES(_mutex);
  // Waits for an item; none when the thread is to end, which it then counts as having done.
  Item nextItem() TL_EXCLUDES(_mutex);
  void endItem() TL_EXCLUDES(_mutex);

  const std::string _name;
  const QueuePriority _priority;
  const std::chrono::milliseconds _idle;
  Mutex _mutex;
  std::condition_variable_any _changed;
  std::deque<Entry> _entries TL_GUARDED_BY(_mutex);
  bool _busy TL_GUARDED_BY(_mutex) = false;      // an item runs
  bool _threaded TL_GUARDED_BY(_mutex) = false;  // the thread serves the queue
  bool _ending TL_GUARDED_BY(_mutex) = false;
  std::thread _thread TL_GUARDED_BY(_mutex);
};

// Names the calling thread by the last 15 bytes of `name`.
void setThreadName(const std::string& name);

// From here on the calling thread leaves the processors to threads of ordinary priority as long as
// these have work, but for a tenth.
void lowerThreadPriority();

}  // namespace platform
