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

}  // namespace

index::~index() {
  platform::MutexLock lock(_mergeThreadMutex);
  if (_mergeThread.joinable()) _mergeThread.join();
}

void index::Vacuum() {
  if (const std::optional<uint8_t> shard = beginVacuum()) startMerge(*shard);
}

std::optional<uint8_t> index::beginVacuum() {
  platform::MutexLock lock(_metricsMutex);
  if (metrics.VacuumInProgress || metrics.HotSuffixes < op.MaxHotSuffixes / 2) return std::nullopt;
  if (op.MaxPageSuffixes == 0) return std::nullopt;  // no page could hold anything
  const MetricsBlock undo = metrics;
  metrics.VacuumInProgress = true;
  const uint8_t shard = chooseShard();
  metrics.LastShardVacuumed = shard;
  leveldb::WriteBatch batch;
  if (writeMetrics(&batch)) return shard;
  static_cast<MetricsBlock&>(metrics) = undo;
  return std::nullopt;
}

// The newest until it is full, then a new one; when all are there, they take turns.
uint8_t index::chooseShard() {
  if (metrics.Shards == 0 || metrics.LastShardSuffixes >= op.MaxShardSuffixes) {
    if (metrics.Shards >= std::min<uint64_t>(op.MaxShards, kMaxShardNumber)) {
      const uint64_t next = metrics.LastShardVacuumed + 1;
      return static_cast<uint8_t>(next > metrics.Shards ? 1 : next);
    }
    ++metrics.Shards;
    metrics.LastShardSuffixes = 0;
  }
  return static_cast<uint8_t>(metrics.Shards);
}

void index::startMerge(uint8_t shard) {
  platform::MutexLock lock(_mergeThreadMutex);
  if (_mergeThread.joinable()) _mergeThread.join();
  try {
    _mergeThread = std::thread([this, shard] { runMerge(shard); });
  } catch (const std::system_error&) {
    platform::MutexLock metricsLock(_metricsMutex);
    metrics.VacuumInProgress = false;
    throw;
  }
}

void index::runMerge(uint8_t shard) {
  platform::setThreadName("tallow-merge");
  const auto start = Clock::now();
  Merge(*this, shard).run();
  platform::returnFreeMemory();
  if (op.CompactAfterVacuum) {
    Compact();
  } else if (hotPartIsSparse()) {
    compactHotPart();
  }
  const std::chrono::duration<double> elapsed = Clock::now() - start;
  platform::MutexLock lock(_metricsMutex);
  metrics.VacuumInProgress = false;
  metrics.Vacuums += 1;
  metrics.VacuumSeconds += elapsed.count();
  leveldb::WriteBatch batch;
  (void)writeMetrics(&batch);
}

// A merge leaves a removed key for each suffix that was hot, and a seek walks over them up to the
// next one that lives. While mail comes in fast there is always one near, and leveldb, busy then,
// soon drops the removed keys by itself.
bool index::hotPartIsSparse() const {
  platform::MutexLock lock(_metricsMutex);
  return metrics.HotSuffixes < op.MaxHotSuffixes / kSparseHotPart;
}

void index::compactHotPart() {
  const leveldb::Slice begin("\x00", 1);
  const leveldb::Slice end("\x01", 1);
  compact(_database, &begin, &end);
}

bool index::commitMerge(leveldb::WriteBatch* batch, uint64_t hotMerged, int64_t pageDelta) {
  platform::MutexLock lock(_metricsMutex);
  const MetricsBlock undo = metrics;
  if (metrics.LastShardVacuumed == metrics.Shards) metrics.LastShardSuffixes += hotMerged;
  metrics.HotSuffixes -= std::min(hotMerged, metrics.HotSuffixes);
  metrics.Pages += static_cast<uint64_t>(pageDelta);
  ++_pageGeneration;
  const bool written = writeMetrics(batch);
  if (!written) static_cast<MetricsBlock&>(metrics) = undo;
  return written;
}

}  // namespace salt
