#include <algorithm>
#include <chrono>
#include <system_error>

#include "platform/Files.h"
#include "platform/Memory.h"
#include "salt/IndexImpl.h"
#include "salt/Merge.h"

// Decides when to merge the hot part, and into which shard; runs the merge and the compactions
// after it.
namespace salt {

namespace {

constexpr uint8_t kHotPart = 0;

}  // namespace

index::~index() {
  _schedule.join();
}

void index::Vacuum() {
  _schedule.mergeAtOnce();
  vacuum();
}

void index::vacuum() {
  if (interrupted()) return;
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

// The newest shard until it is full, then a new one; once all MaxShards exist, in turn.
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
  try {
    _schedule.startMerge([this, shard] { runMerge(shard); });
  } catch (const std::system_error&) {
    platform::MutexLock commitLock(_commitMutex);
    platform::MutexLock metricsLock(_metricsMutex);
    metrics.VacuumInProgress = false;
    throw;
  }
}

void index::runMerge(uint8_t shard) {
  const platform::CrashNote note(crashNotes());
  _schedule.waitForMore(op.MaxHotSuffixes, suffixesPerShard(), [this] { return hotSuffixes(); });
  mergeInto(shard);
}

void index::mergeInto(uint8_t shard) {
  const auto start = Clock::now();
  {
    const Activity::Work merge(_schedule.maintenance());
    const bool merged = mergePages(shard, true);
    platform::returnFreeMemory();
    if (op.CompactAfterVacuum && !interrupted()) {
      compactRange(nullptr, nullptr);
      _database.env->waitForDisk();
    } else if (merged) {
      compactPart(kHotPart);
      compactPart(shard);
    }
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

// Posting lists must never be found with other pages than their own, even after a power loss. So
// the old file is gone from disk before a page changes, and the pages are on disk before the new
// file is.
bool index::mergePages(uint8_t shard, bool hot) {
  setPostings(shard, nullptr);
  if (!removePostings(_database.path, shard)) return false;
  Merge merge(*this, shard, hot);
  if (!merge.run()) return false;
  const PostingsOwner owner = postingsOwner(shard);
  const std::string postings = merge.postings(owner);
  if (postings.empty() || !Sync()) return true;
  std::optional<TLError> error;
  if (platform::writeFileAtomically(postingsPath(_database.path, shard), postings, &error)) {
    setPostings(shard, Postings::open(_database.path, owner));
  } else {
    Log.error("Error writing postings: {}", error->message);
  }
  return true;
}

// Sets VacuumInProgress meanwhile, so that no merge changes the pages.
void index::makeMissingPostings() {
  uint64_t shards = 0;
  std::shared_ptr<const ShardPostings> present;
  {
    platform::MutexLock lock(_metricsMutex);
    if (metrics.VacuumInProgress) return;
    metrics.VacuumInProgress = true;
    shards = std::min<uint64_t>(metrics.Shards, kMaxShardNumber);
    present = _postings;
  }
  for (size_t shard = 1; shard <= shards && !interrupted(); ++shard) {
    if (shard < present->size() && (*present)[shard] != nullptr) continue;
    if (!mergePages(static_cast<uint8_t>(shard), false)) break;
  }
  platform::MutexLock lock(_metricsMutex);
  metrics.VacuumInProgress = false;
}

uint64_t index::hotSuffixes() const {
  platform::MutexLock lock(_metricsMutex);
  return metrics.HotSuffixes;
}

uint64_t index::suffixesPerShard() const {
  platform::MutexLock lock(_metricsMutex);
  const uint64_t inShards = metrics.Suffixes - std::min(metrics.HotSuffixes, metrics.Suffixes);
  return inShards / std::max<uint64_t>(metrics.Shards, 1);
}

// A merge leaves a tombstone for each suffix that was hot, and a seek iterates over them up to the
// next live suffix. leveldb drops tombstones as they move down, but not those above the few hot
// suffixes that have once reached a deep level; these suffixes stay there, and so do the
// tombstones. When nothing is hot, compacting the hot part removes all of them; during ingest
// something would always be left.
//
// New pages must not stay in levels that ingest passes through either. leveldb splits its files by
// size alone: a file with the last hot suffixes and the first texts spans all shards, and is then
// merged with all of their pages in the next level.
void index::compactPart(uint8_t shard) {
  if (interrupted()) return;
  const char first = static_cast<char>(shard);
  const char behind = static_cast<char>(shard + 1);
  const leveldb::Slice begin(&first, 1);
  const leveldb::Slice end(&behind, 1);
  compactRange(&begin, &end);
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
