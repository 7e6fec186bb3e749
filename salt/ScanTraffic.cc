#include "salt/ScanTraffic.h"

#include <algorithm>

namespace salt {

namespace {

using Clock = std::chrono::steady_clock;

// From one scan of a search to its next, or to its end.
constexpr std::chrono::milliseconds kGap{5};

}  // namespace

void ScanTraffic::begin() {
  platform::MutexLock lock(_mutex);
  if (_running++ == 0) _changed.notify_all();
}

void ScanTraffic::end() {
  platform::MutexLock lock(_mutex);
  if (--_running == 0) _changed.notify_all();
}

void ScanTraffic::waitForEnd(std::chrono::nanoseconds most) {
  const auto deadline = Clock::now() + most;
  platform::MutexLock lock(_mutex);
  for (;;) {
    if (!_changed.wait_until(_mutex, deadline, [this] { return !any(); })) return;
    const auto quiet = std::min(deadline, Clock::now() + kGap);
    if (!_changed.wait_until(_mutex, quiet, [this] { return any(); })) return;
  }
}

}  // namespace salt
