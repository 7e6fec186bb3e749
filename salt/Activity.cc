#include "salt/Activity.h"

#include <algorithm>

namespace salt {

namespace {

using Clock = std::chrono::steady_clock;

}  // namespace

void Activity::begin() {
  platform::MutexLock lock(_mutex);
  if (_running++ == 0) _changed.notify_all();
}

void Activity::end() {
  platform::MutexLock lock(_mutex);
  if (--_running == 0) _changed.notify_all();
}

void Activity::waitForEnd(std::chrono::nanoseconds most) {
  const auto deadline = Clock::now() + most;
  platform::MutexLock lock(_mutex);
  for (;;) {
    if (!_changed.wait_until(_mutex, deadline, [this] { return !any(); })) return;
    const auto quiet = std::min(deadline, Clock::now() + _gap);
    if (!_changed.wait_until(_mutex, quiet, [this] { return any(); })) return;
  }
}

}  // namespace salt
