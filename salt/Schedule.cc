#include "salt/Schedule.h"

#include <algorithm>
#include <utility>

#include "platform/Clock.h"
#include "platform/Queue.h"

namespace salt {

namespace {

using Clock = std::chrono::steady_clock;
using std::chrono::milliseconds;
using std::chrono::nanoseconds;
using std::chrono::seconds;

// The size that the hot part should reach before a merge: a share of its shard, within multiples of
// MaxHotSuffixes.
constexpr uint64_t kMinWorthwhile = 2;
constexpr uint64_t kMaxWorthwhile = 8;
constexpr uint64_t kShardPart = 2;
constexpr uint32_t kSmallHotPart = 100000;  // below this waiting gains nothing
// Mail pours in while each interval brings at least this many suffixes, those of about 25 mails.
constexpr milliseconds kInterval{250};
constexpr uint64_t kPouring = 10000;
constexpr seconds kMaxWaitForMore{60};

constexpr seconds kMaxWaitForMaintenance{10};

constexpr int kWaitOverComputing = 3;
constexpr milliseconds kMaxCredit{100};
constexpr milliseconds kMinCredit{2};  // waking up has a cost too

}  // namespace

void Schedule::startMerge(std::function<void()> merge) {
  platform::MutexLock lock(_threadMutex);
  if (_thread.joinable()) _thread.join();
  setMerging(true);
  try {
    _thread = std::thread([this, merge = std::move(merge)] {
      platform::setThreadName("tallow-merge");
      merge();
      setMerging(false);
    });
  } catch (...) {
    setMerging(false);
    throw;
  }
}

void Schedule::join() {
  platform::MutexLock lock(_threadMutex);
  if (_thread.joinable()) _thread.join();
}

void Schedule::setMerging(bool merging) {
  platform::MutexLock lock(_mutex);
  _merging = merging;
  if (merging) return;
  _atOnce = false;
  _changed.notify_all();
}

void Schedule::waitForMore(uint32_t maxHotSuffixes, uint64_t shardSuffixes,
                           const std::function<uint64_t()>& hotSuffixes) {
  if (maxHotSuffixes < kSmallHotPart) return;
  const uint64_t worthwhile = std::clamp(
      shardSuffixes / kShardPart, kMinWorthwhile * maxHotSuffixes, kMaxWorthwhile * maxHotSuffixes);
  const auto deadline = Clock::now() + kMaxWaitForMore;
  uint64_t before = hotSuffixes();
  while (before < worthwhile && Clock::now() < deadline) {
    if (!pause()) return;
    const uint64_t hot = hotSuffixes();
    if (hot < before + kPouring) return;
    before = hot;
  }
}

bool Schedule::pause() {
  platform::MutexLock lock(_mutex);
  const auto over = [this]() TL_REQUIRES(_mutex) { return _atOnce || _interrupted; };
  return !_changed.wait_for(_mutex, kInterval, over);
}

void Schedule::mergeAtOnce() {
  platform::MutexLock lock(_mutex);
  _atOnce = true;
  _changed.notify_all();
}

void Schedule::waitForMerge() {
  platform::MutexLock lock(_mutex);
  while (_merging && !_interrupted) _changed.wait(_mutex);
}

void Schedule::waitForMaintenance() {
  _maintenance.waitForEnd(kMaxWaitForMaintenance);
}

void Schedule::interrupt() {
  {
    platform::MutexLock lock(_mutex);
    _interrupted = true;
    _changed.notify_all();
  }
  _maintenance.interrupt();
}

MergePace::MergePace(Activity& scans) : _scans(scans), _computed(platform::threadProcessorTime()) {}

void MergePace::giveWay() {
  if (!_scans.any()) return;
  const nanoseconds computed = platform::threadProcessorTime();
  _credit += kWaitOverComputing * (computed - std::exchange(_computed, computed));
  _credit = std::min<nanoseconds>(_credit, kMaxCredit);
  if (_credit < kMinCredit) return;
  const auto start = Clock::now();
  _scans.waitForEnd(_credit);
  _credit -= Clock::now() - start;
}

}  // namespace salt
