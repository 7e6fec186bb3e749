#include "platform/Queue.h"

#include <pthread.h>
#include <sched.h>
#include <sys/resource.h>
#include <unistd.h>

#include <system_error>
#include <utility>

namespace platform {

namespace {

constexpr size_t kMaxThreadNameBytes = 15;
constexpr int kBackgroundNiceness = 10;  // a weight of 110; normal threads have 1024

}  // namespace

void setThreadName(const std::string& name) {
  const size_t cut = name.size() > kMaxThreadNameBytes ? name.size() - kMaxThreadNameBytes : 0;
  pthread_setname_np(pthread_self(), name.c_str() + cut);
}

// On Linux niceness applies to a single thread.
void lowerThreadPriority() {
  setpriority(PRIO_PROCESS, static_cast<id_t>(gettid()), kBackgroundNiceness);
}

SerialQueue::SerialQueue(std::string name, QueuePriority priority, std::chrono::milliseconds idle)
    : _name(std::move(name)), _priority(priority), _idle(idle) {}

SerialQueue::~SerialQueue() {
  std::thread thread;
  {
    MutexLock lock(_mutex);
    _ending = true;
    thread = std::move(_thread);
  }
  _changed.notify_all();
  if (thread.joinable()) thread.join();
}

bool SerialQueue::start() {
  MutexLock lock(_mutex);
  return _threaded || startThread();
}

bool SerialQueue::startThread() {
  // A thread that has ended no longer takes the mutex, so joining it here cannot deadlock.
  if (_thread.joinable()) _thread.join();
  try {
    _thread = std::thread([this] { run(); });
  } catch (const std::system_error&) {
    return false;
  }
  _threaded = true;
  return true;
}

bool SerialQueue::async(Item item) {
  {
    MutexLock lock(_mutex);
    if (!_threaded && !startThread()) return false;
    _entries.push_back({std::move(item), nullptr});
  }
  _changed.notify_all();
  return true;
}

void SerialQueue::sync(const Item& item) {
  {
    MutexLock lock(_mutex);
    const void* const self = &item;
    if (_busy || !_entries.empty()) {
      _entries.push_back({nullptr, self});
      while (_busy || _entries.front().caller != self) _changed.wait(_mutex);
      _entries.pop_front();
    }
    _busy = true;
  }
  struct End {
    SerialQueue& queue;
    ~End() { queue.endItem(); }
  } const end{*this};
  item();
}

void SerialQueue::endItem() {
  {
    MutexLock lock(_mutex);
    _busy = false;
  }
  // Needed even with an empty queue: the thread measures its idle time from here.
  _changed.notify_all();
}

SerialQueue::Item SerialQueue::nextItem() {
  MutexLock lock(_mutex);
  const auto mine = [this]() TL_REQUIRES(_mutex) {
    return !_busy && !_entries.empty() && _entries.front().caller == nullptr;
  };
  const auto idle = [this]() TL_REQUIRES(_mutex) { return !_busy && _entries.empty(); };
  while (!mine()) {
    const bool timed = idle() && !_ending && _idle != kForever;
    if (_ending && idle()) break;
    if (!timed) {
      _changed.wait(_mutex);
    } else if (_changed.wait_for(_mutex, _idle) == std::cv_status::timeout && idle()) {
      break;
    }
  }
  if (!mine()) {
    _threaded = false;
    return nullptr;
  }
  _busy = true;
  Item item = std::move(_entries.front().item);
  _entries.pop_front();
  return item;
}

void SerialQueue::run() {
  setThreadName(_name);
  if (_priority == QueuePriority::background) {
    const sched_param parameters{};
    pthread_setschedparam(pthread_self(), SCHED_BATCH, &parameters);
  } else if (_priority == QueuePriority::low) {
    lowerThreadPriority();
  }
  while (Item item = nextItem()) {
    item();
    item = nullptr;  // release its captures before the queue counts as idle
    endItem();
  }
}

}  // namespace platform
