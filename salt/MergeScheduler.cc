#include "salt/MergeScheduler.h"

#include <algorithm>
#include <chrono>
#include <system_error>
#include <utility>

#include "platform/Memory.h"
#include "salt/IndexImpl.h"
#include "salt/Merge.h"

namespace salt {

namespace {

using Clock = std::chrono::steady_clock;
using MetricsBlock = Index::MetricsBlock;

constexpr uint8_t kHotPart = 0;

// The mean size of the shards.
uint64_t suffixesPerShard(const MetricsBlock& counters) {
  const uint64_t inShards = counters.Suffixes - std::min(counters.HotSuffixes, counters.Suffixes);
  return inShards / std::max<uint64_t>(counters.Shards, 1);
}

}  // namespace

void MergeScheduler::mergeAtOnce() {
  _schedule.mergeAtOnce();
  mergeIfDue();
}

void MergeScheduler::mergeIfDue() {
  if (_schedule.interrupted()) return;
  if (const std::optional<uint8_t> shard = beginMerge()) startMerge(*shard);
}

std::optional<uint8_t> MergeScheduler::beginMerge() {
  uint8_t shard = 0;
  const auto due = [this](const MetricsBlock& counters) { return isDue(counters); };
  const bool begun = _idx.commitIf(due, [&](MetricsBlock& counters) {
    counters.VacuumInProgress = true;
    shard = chooseShard(counters);
    counters.LastShardVacuumed = shard;
  });
  return begun ? std::optional(shard) : std::nullopt;
}

// Without suffixes in a page no page could hold anything.
bool MergeScheduler::isDue(const MetricsBlock& counters) const {
  return _idx.op.MaxPageSuffixes != 0 && !counters.VacuumInProgress &&
         counters.HotSuffixes >= _idx.op.MaxHotSuffixes / 2;
}

// The newest shard until it is full, then a new one; once all MaxShards exist, in turn.
uint8_t MergeScheduler::chooseShard(MetricsBlock& counters) const {
  if (counters.Shards == 0 || counters.LastShardSuffixes >= _idx.op.MaxShardSuffixes) {
    if (counters.Shards >= std::min<uint64_t>(_idx.op.MaxShards, kMaxShardNumber)) {
      const uint64_t next = counters.LastShardVacuumed + 1;
      return static_cast<uint8_t>(next > counters.Shards ? 1 : next);
    }
    ++counters.Shards;
    counters.LastShardSuffixes = 0;
  }
  return static_cast<uint8_t>(counters.Shards);
}

void MergeScheduler::startMerge(uint8_t shard) {
  try {
    _schedule.startMerge([this, shard] { runMerge(shard); });
  } catch (const std::system_error&) {
    _idx.adjust([](MetricsBlock& counters) { counters.VacuumInProgress = false; });
    throw;
  }
}

void MergeScheduler::runMerge(uint8_t shard) {
  const platform::CrashNote note(_idx.crashNotes());
  _schedule.waitForMore(_idx.op.MaxHotSuffixes, suffixesPerShard(_idx.counters()),
                        [this] { return _idx.counters().HotSuffixes; });
  mergeInto(shard);
}

void MergeScheduler::mergeInto(uint8_t shard) {
  const auto start = Clock::now();
  {
    const Activity::Work merge(_schedule.maintenance());
    const bool merged = mergePages(shard, true);
    platform::returnFreeMemory();
    if (_idx.op.CompactAfterVacuum && !_schedule.interrupted()) {
      _idx.compactRange(nullptr, nullptr);
      _idx.waitForDisk();
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
  leveldb::WriteBatch batch;
  if (!_idx.commit(&batch, finish)) _idx.adjust(finish);
}

// Posting lists must never be found with other pages than their own, even after a power loss. So
// the old file is gone from disk before a page changes, and the pages are on disk before the new
// file is.
bool MergeScheduler::mergePages(uint8_t shard, bool hot) {
  _idx.setPostings(shard, nullptr);
  if (!removePostings(_idx.path(), shard)) return false;
  Merge merge(_idx, shard, hot);
  if (!merge.run()) return false;
  if (!merge.finishPostings() || !_idx.Sync()) return true;
  const PostingsOwner owner = _idx.postingsOwner(shard);
  if (merge.writePostings(owner)) _idx.setPostings(shard, Postings::open(_idx.path(), owner));
  return true;
}

// Records a merge as running meanwhile, in memory only, so that no merge changes the pages.
void MergeScheduler::makeMissingPostings() {
  bool running = false;
  _idx.adjust(
      [&](MetricsBlock& counters) { running = std::exchange(counters.VacuumInProgress, true); });
  if (running) return;
  const auto present = _idx.postings();
  const auto shards = std::min<uint64_t>(_idx.counters().Shards, kMaxShardNumber);
  for (size_t shard = 1; shard <= shards && !_schedule.interrupted(); ++shard) {
    if (shard < present->size() && (*present)[shard] != nullptr) continue;
    if (!mergePages(static_cast<uint8_t>(shard), false)) break;
  }
  _idx.adjust([](MetricsBlock& counters) { counters.VacuumInProgress = false; });
}

bool MergeScheduler::compact() {
  _schedule.waitForMerge();
  if (_schedule.interrupted()) return true;
  const Activity::Work compaction(_schedule.maintenance());
  const bool done = _idx.compactRange(nullptr, nullptr);
  _idx.waitForDisk();
  if (done) makeMissingPostings();
  return done;
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
void MergeScheduler::compactPart(uint8_t shard) {
  if (_schedule.interrupted()) return;
  const char first = static_cast<char>(shard);
  const char behind = static_cast<char>(shard + 1);
  const leveldb::Slice begin(&first, 1);
  const leveldb::Slice end(&behind, 1);
  _idx.compactRange(&begin, &end);
}

}  // namespace salt
