#include "platform/Queue.h"

#include <pthread.h>
#include <sched.h>
#include <sys/resource.h>
#include <unistd.h>

#include <latch>
#include <utility>

namespace platform {

namespace {

constexpr size_t kLongestThreadName = 15;
constexpr int kBackgroundNiceness = 10;  // a weight of 110 where ordinary threads have 1024

}  // namespace

void setThreadName(const std::string& name) {
  const size_t cut = name.size() > kLongestThreadName ? name.size() - kLongestThreadName : 0;
  pthread_setname_np(pthread_self(), name.c_str() + cut);
}

// Linux has a niceness for each thread.
void lowerThreadPriority() {
  setpriority(PRIO_PROCESS, static_cast<id_t>(gettid()), kBackgroundNiceness);
}

SerialQueue::SerialQueue(std::string name, QueuePriority priority)
    : _name(std::move(name)), _priority(priority), _thread([this] { run(); }) {}

SerialQueue::~SerialQueue() {
  {
    MutexLock lock(_mutex);
    _ending = true;
  }
  _changed.notify_all();
  _thread.join();
}

void SerialQueue::async(Item item) {
  {
    MutexLock lock(_mutex);
    _items.push_back(std::move(item));
  }
  _changed.notify_one();
}

void SerialQueue::sync(const Item& item) {
  std::latch done(1);
  async([&] {
    item();
    done.count_down();
  });
  done.wait();
}

void SerialQueue::run() {
  setThreadName(_name);
  if (_priority == QueuePriority::background) {
    const sched_param parameters{};
    pthread_setschedparam(pthread_self(), SCHED_BATCH, &parameters);
  }
  for (;;) {
    Item item;
    {
      MutexLock lock(_mutex);
      while (_items.empty() && !_ending) _changed.wait(_mutex);
      if (_items.empty()) return;
      item = std::move(_items.front());
      _items.pop_front();
    }
    item();
  }
}

}  // namespace platform
