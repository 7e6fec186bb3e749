#include <algorithm>
#include <system_error>

#include "platform/Memory.h"
#include "platform/Queue.h"
#include "salt/IndexImpl.h"
#include "salt/Merge.h"

// Moving the hot part into shards: when, where to, and on which thread.
namespace salt {

namespace {

// A hot part below this part of the most it may hold is sparse.
constexpr uint32_t kSparseHotPart = 16;
// On the disk; a hot suffix takes some 16 bytes there, and a mark that removes one takes as much.
constexpr uint64_t kManyHotBytes = 96 * 1024 * 1024;
constexpr uint64_t kManyBytesASuffix = 64;

// While kPouring suffixes or more come in each interval, a merge waits until the hot part is
// kWorthwhile times MaxHotSuffixes, unless that is small anyway.
constexpr uint32_t kWorthwhile = 2;
constexpr uint32_t kSmallHotPart = 100000;
constexpr std::chrono::milliseconds kInterval{20};
constexpr uint64_t kPouring = 1000;  // two to three mails
constexpr std::chrono::seconds kLongestWait{5};

const leveldb::Slice kHotBegin("\x00", 1);
const leveldb::Slice kHotEnd("\x01", 1);

}  // namespace

index::~index() {
  platform::MutexLock lock(_mergeThreadMutex);
  if (_mergeThread.joinable()) _mergeThread.join();
}

void index::Vacuum() {
  if (const std::optional<uint8_t> shard = beginVacuum()) startMerge(*shard);
}

std::optional<uint8_t> index::beginVacuum() {
  platform::MutexLock lock(_commitMutex);
  if (!vacuumIsDue()) return std::nullopt;
  uint8_t shard = 0;
  leveldb::WriteBatch batch;
  const bool written = commit(&batch, false, [&](MetricsBlock& counters) {
    counters.VacuumInProgress = true;
    shard = chooseShard(counters);
    counters.LastShardVacuumed = shard;
  });
  return written ? std::optional(shard) : std::nullopt;
}

bool index::vacuumIsDue() const {
  if (op.MaxPageSuffixes == 0) return false;  // no page could hold anything
  platform::MutexLock lock(_metricsMutex);
  return !metrics.VacuumInProgress && metrics.HotSuffixes >= op.MaxHotSuffixes / 2;
}

// The newest until it is full, then a new one; when all are there, they take turns.
uint8_t index::chooseShard(MetricsBlock& counters) const {
  if (counters.Shards == 0 || counters.LastShardSuffixes >= op.MaxShardSuffixes) {
    if (counters.Shards >= std::min<uint64_t>(op.MaxShards, kMaxShardNumber)) {
      const uint64_t next = counters.LastShardVacuumed + 1;
      return static_cast<uint8_t>(next > counters.Shards ? 1 : next);
    }
    ++counters.Shards;
    counters.LastShardSuffixes = 0;
  }
  return static_cast<uint8_t>(counters.Shards);
}

void index::startMerge(uint8_t shard) {
  platform::MutexLock lock(_mergeThreadMutex);
  if (_mergeThread.joinable()) _mergeThread.join();
  try {
    _mergeThread = std::thread([this, shard] { runMerge(shard); });
  } catch (const std::system_error&) {
    platform::MutexLock commitLock(_commitMutex);
    platform::MutexLock metricsLock(_metricsMutex);
    metrics.VacuumInProgress = false;
    throw;
  }
}

void index::runMerge(uint8_t shard) {
  platform::setThreadName("tallow-merge");
  waitForMore();
  const auto start = Clock::now();
  Merge(*this, shard).run();
  platform::returnFreeMemory();
  if (op.CompactAfterVacuum) {
    Compact();
  } else if (hotPartWantsCompaction()) {
    compactRange(&kHotBegin, &kHotEnd);
  }
  const std::chrono::duration<double> elapsed = Clock::now() - start;
  const auto finish = [&elapsed](MetricsBlock& counters) {
    counters.VacuumInProgress = false;
    counters.Vacuums += 1;
    counters.VacuumSeconds += elapsed.count();
  };
  platform::MutexLock lock(_commitMutex);
  leveldb::WriteBatch batch;
  if (commit(&batch, false, finish)) return;
  platform::MutexLock metricsLock(_metricsMutex);
  finish(metrics);
}

// Each merge rewrites its whole shard, so that while mail pours in fewer and larger ones cost less.
void index::waitForMore() const {
  if (op.MaxHotSuffixes < kSmallHotPart) return;
  const auto deadline = Clock::now() + kLongestWait;
  uint64_t before = hotSuffixes();
  while (before < kWorthwhile * uint64_t{op.MaxHotSuffixes} && Clock::now() < deadline) {
    std::this_thread::sleep_for(kInterval);
    const uint64_t hot = hotSuffixes();
    if (hot < before + kPouring) return;
    before = hot;
  }
}

uint64_t index::hotSuffixes() const {
  platform::MutexLock lock(_metricsMutex);
  return metrics.HotSuffixes;
}

// A merge leaves a mark for each suffix that was hot, and a seek walks over them up to the next
// suffix that lives.
//
// While mail comes in fast there is always one near. But once leveldb has hot suffixes in a level
// deep down, it keeps the marks that come in above them, merges these with all that follows, and
// hardly ever gets to the level where they meet: the marks get more and more until most of its work
// is theirs.
bool index::hotPartWantsCompaction() const {
  const uint64_t hot = hotSuffixes();
  if (hot < op.MaxHotSuffixes / kSparseHotPart) return true;
  const leveldb::Range range(kHotBegin, kHotEnd);
  uint64_t bytes = 0;
  db->GetApproximateSizes(&range, 1, &bytes);
  return bytes > kManyHotBytes && bytes > kManyBytesASuffix * hot;
}

bool index::commitMerge(leveldb::WriteBatch* batch, uint64_t hotMerged, int64_t pageDelta) {
  platform::MutexLock lock(_commitMutex);
  return commit(batch, true, [&](MetricsBlock& counters) {
    if (counters.LastShardVacuumed == counters.Shards) counters.LastShardSuffixes += hotMerged;
    counters.HotSuffixes -= std::min(hotMerged, counters.HotSuffixes);
    counters.Pages += static_cast<uint64_t>(pageDelta);
  });
}

}  // namespace salt
