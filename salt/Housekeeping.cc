#include "salt/Housekeeping.h"

namespace salt {

void Housekeeping::begin() {
  platform::MutexLock lock(_mutex);
  ++_running;
}

void Housekeeping::end() {
  platform::MutexLock lock(_mutex);
  if (--_running == 0) _ended.notify_all();
}

void Housekeeping::waitForEnd(std::chrono::nanoseconds most) {
  const auto deadline = std::chrono::steady_clock::now() + most;
  platform::MutexLock lock(_mutex);
  while (_running > 0) {
    if (_ended.wait_until(_mutex, deadline) == std::cv_status::timeout) return;
  }
}

}  // namespace salt
