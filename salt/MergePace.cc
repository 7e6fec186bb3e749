#include "salt/MergePace.h"

#include <algorithm>
#include <utility>

#include "platform/Clock.h"
#include "salt/Activity.h"

namespace salt {

namespace {

using Clock = std::chrono::steady_clock;
using std::chrono::milliseconds;
using std::chrono::nanoseconds;

constexpr int kWaitOverComputing = 3;
constexpr milliseconds kMostCredit{100};
constexpr milliseconds kLeastCredit{2};  // waking up costs, too

}  // namespace

MergePace::MergePace(Activity& scans) : _scans(scans), _computed(platform::threadProcessorTime()) {}

void MergePace::giveWay() {
  if (!_scans.any()) return;
  const nanoseconds computed = platform::threadProcessorTime();
  _credit += kWaitOverComputing * (computed - std::exchange(_computed, computed));
  _credit = std::min<nanoseconds>(_credit, kMostCredit);
  if (_credit < kLeastCredit) return;
  const auto start = Clock::now();
  _scans.waitForEnd(_credit);
  _credit -= Clock::now() - start;
}

}  // namespace salt
