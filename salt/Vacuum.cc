#include <algorithm>
#include <system_error>

#include "platform/Files.h"
#include "platform/Memory.h"
#include "platform/Queue.h"
#include "salt/IndexImpl.h"
#include "salt/Merge.h"

// Moving the hot part into shards: when, where to, and on which thread.
namespace salt {

namespace {

constexpr uint8_t kHotPart = 0;

// While kPouring suffixes or more come in each interval, a merge waits until the hot part is
// kWorthwhile times MaxHotSuffixes, unless that is small anyway.
constexpr uint32_t kWorthwhile = 2;
constexpr uint32_t kSmallHotPart = 100000;
constexpr std::chrono::milliseconds kInterval{250};
constexpr uint64_t kPouring = 10000;  // some 25 mails
constexpr std::chrono::seconds kLongestWait{5};

}  // namespace

index::~index() {
  platform::MutexLock lock(_mergeThreadMutex);
  if (_mergeThread.joinable()) _mergeThread.join();
}

void index::Vacuum() {
  {
    platform::MutexLock lock(_paceMutex);
    _mergeAtOnce = true;
  }
  _paceChanged.notify_all();
  vacuum();
}

void index::vacuum() {
  if (_interrupted) return;
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
  const auto setMerging = [this](bool merging) {
    platform::MutexLock paceLock(_paceMutex);
    _merging = merging;
  };
  try {
    setMerging(true);
    _mergeThread = std::thread([this, shard] { runMerge(shard); });
  } catch (const std::system_error&) {
    setMerging(false);
    platform::MutexLock commitLock(_commitMutex);
    platform::MutexLock metricsLock(_metricsMutex);
    metrics.VacuumInProgress = false;
    throw;
  }
}

void index::runMerge(uint8_t shard) {
  platform::setThreadName("tallow-merge");
  const platform::CrashNote note(crashNotes());
  waitForMore();
  mergeInto(shard);
  platform::MutexLock lock(_paceMutex);
  _merging = false;
  _mergeAtOnce = false;
  _paceChanged.notify_all();
}

void index::waitForMerge() {
  platform::MutexLock lock(_paceMutex);
  while (_merging && !_interrupted) _paceChanged.wait(_paceMutex);
}

void index::mergeInto(uint8_t shard) {
  const auto start = Clock::now();
  {
    const Activity::Work merge(_housekeeping);
    const bool merged = mergePages(shard, true);
    platform::returnFreeMemory();
    if (op.CompactAfterVacuum && !_interrupted) {
      compactRange(nullptr, nullptr);
      _database.files->waitForDisk();
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

// Postings must never be those of other pages, whatever is left by a loss of power. So the old ones
// are gone from the disk before a page changes, and the pages are on it before the new ones are.
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

// Counts as a merge meanwhile, so that no other changes the pages.
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
  for (size_t shard = 1; shard <= shards && !_interrupted; ++shard) {
    if (shard < present->size() && (*present)[shard] != nullptr) continue;
    if (!mergePages(static_cast<uint8_t>(shard), false)) break;
  }
  platform::MutexLock lock(_metricsMutex);
  metrics.VacuumInProgress = false;
}

// Each merge rewrites its whole shard, so that while mail pours in fewer and larger ones cost less.
void index::waitForMore() {
  if (op.MaxHotSuffixes < kSmallHotPart) return;
  const auto pause = [this] {
    platform::MutexLock lock(_paceMutex);
    const auto over = [this]() TL_REQUIRES(_paceMutex) { return _mergeAtOnce || _interrupted; };
    return !_paceChanged.wait_for(_paceMutex, kInterval, over);
  };
  const auto deadline = Clock::now() + kLongestWait;
  uint64_t before = hotSuffixes();
  while (before < kWorthwhile * uint64_t{op.MaxHotSuffixes} && Clock::now() < deadline) {
    if (!pause()) return;
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
// suffix that lives. leveldb drops marks as they move down, but not above the few hot suffixes that
// it once got into a level deep down, and those stay there. With nothing hot left, the marks and
// what they remove come to nothing; while much is added there would always be something.
//
// Nor may new pages stay where mail passes on its way down. leveldb cuts its files by size alone: a
// file of the last hot suffixes and the first texts spans all shards, and is merged with all of
// their pages in the next level.
void index::compactPart(uint8_t shard) {
  if (_interrupted) return;
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
