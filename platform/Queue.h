#pragma once

#include <chrono>
#include <condition_variable>
#include <deque>
#include <functional>
#include <string>
#include <thread>

#include "platform/Mutex.h"

namespace platform {

// Scheduling of the queue's thread: normal, as a batch job, or with low priority.
enum class QueuePriority { unspecified, background, low };

// A serial queue: items run one at a time, in order of submission. Items of `async` run on a thread
// that the queue starts on demand and that ends after the queue has been idle for a while. Items of
// `sync` run on the calling thread, so they need no other.
//
// Threads: any thread may submit. Calling `sync` from an item of the same queue is a deadlock. The
// destructor runs what is queued, then joins the thread; it must not run on that thread.
class SerialQueue {
 public:
  using Item = std::function<void()>;

  static constexpr std::chrono::milliseconds kIdle{2000};
  static constexpr std::chrono::milliseconds kForever{std::chrono::milliseconds::max()};

  // The thread is named with the last 15 bytes of `name`, the most that Linux keeps, and ends after
  // `idle` without an item.
  explicit SerialQueue(std::string name, QueuePriority priority = QueuePriority::unspecified,
                       std::chrono::milliseconds idle = kIdle);
  ~SerialQueue();
  SerialQueue(const SerialQueue&) = delete;
  SerialQueue& operator=(const SerialQueue&) = delete;

  [[nodiscard]] const std::string& name() const { return _name; }

  // Starts the thread before the first item. False when the system cannot create a thread. After
  // success a queue with kForever accepts every item.
  [[nodiscard]] bool start() TL_EXCLUDES(_mutex);

  // Submits the item and returns at once. False when the system cannot create the thread it needs:
  // the item is destroyed without having run.
  [[nodiscard]] bool async(Item item) TL_EXCLUDES(_mutex);

  // Like async, but runs the item with sync if the system cannot create a thread. Not from an item
  // of the same queue.
  void submit(const Item& item) TL_EXCLUDES(_mutex) {
    if (!async(item)) sync(item);
  }

  // Runs the item on the calling thread after all earlier ones. Cannot fail.
  void sync(const Item& item) TL_EXCLUDES(_mutex);

  // Returns when everything submitted before has run.
  void drain() {
    sync([] {});
  }

 private:
  // An item for the thread, or the place in line of a caller of `sync`.
  struct Entry {
    Item item;
    const void* caller = nullptr;
  };

  bool startThread() TL_REQUIRES(_mutex);
  void run() TL_EXCLUDES(_mutex);
  // Waits for an item; null when the thread is to end, which is then already recorded.
  Item nextItem() TL_EXCLUDES(_mutex);
  void endItem() TL_EXCLUDES(_mutex);

  const std::string _name;
  const QueuePriority _priority;
  const std::chrono::milliseconds _idle;
  Mutex _mutex;
  std::condition_variable_any _changed;
  std::deque<Entry> _entries TL_GUARDED_BY(_mutex);
  bool _busy TL_GUARDED_BY(_mutex) = false;      // an item is running
  bool _threaded TL_GUARDED_BY(_mutex) = false;  // the thread is serving the queue
  bool _ending TL_GUARDED_BY(_mutex) = false;
  std::thread _thread TL_GUARDED_BY(_mutex);
};

// Names the calling thread by the last 15 bytes of `name`.
void setThreadName(const std::string& name);

// Lowers the calling thread's priority: it leaves all but about a tenth of the processor time to
// normal threads that have work.
void lowerThreadPriority();

}  // namespace platform
