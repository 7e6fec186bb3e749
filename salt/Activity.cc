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

void Activity::interrupt() {
  platform::MutexLock lock(_mutex);
  _interrupted = true;
  _changed.notify_all();
}

void Activity::waitForEnd(std::chrono::nanoseconds timeout) {
  const auto deadline = Clock::now() + timeout;
  platform::MutexLock lock(_mutex);
  for (;;) {
    const auto over = [this]() TL_REQUIRES(_mutex) { return _interrupted || !any(); };
    if (!_changed.wait_until(_mutex, deadline, over) || _interrupted) return;
    const auto quiet = std::min(deadline, Clock::now() + _gap);
    const auto again = [this]() TL_REQUIRES(_mutex) { return _interrupted || any(); };
    if (!_changed.wait_until(_mutex, quiet, again) || _interrupted) return;
  }
}

}  // namespace salt
