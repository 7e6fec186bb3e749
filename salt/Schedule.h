#pragma once

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <functional>
#include <thread>

#include "platform/Mutex.h"
#include "salt/Activity.h"

namespace salt {

// Decides when the background work of an index runs and which work waits for which. Scans have
// priority and never wait; ingest comes next; merges and compactions take the remaining time.
//
//   this waits                        for this                                   at most
//   a merge, before it begins         more mail, while much comes in             60 s
//   a merge, between two pages        running scans (MergePace)                  3 times its work
//   a batch of mail, before it        a running merge or compaction on demand    10 s
//   begins (waitForMaintenance)
//   a compaction on demand            the running merge                          its end
//   the end of the index              the running merge                          its next page
//
// None of these holds a lock meanwhile, and an interruption ends them at once. Below this level,
// with locks that no scan needs:
//
//   a write that would fill the       a compaction on demand (BatchWriter)       1 s
//   memtable or needs a new log
//   a write into a new log            the previous log on the disk (LogSync)     a sync of 1 MiB
//   leveldb, after writing a table    four tables not yet on the disk            their syncs
//                                     (OrderedSyncEnv)
//   a flush of an idle memtable       10 s without a write (BatchWriter)         a compaction's end
//
// docs/decisions.md gives the reasons. An interruption cannot end a compaction of leveldb that has
// begun.
//
// Any thread. The schedule owns the merge thread, which must be joined before anything that the
// merge uses is destroyed.
class Schedule {
 public:
  Schedule() = default;
  ~Schedule() { join(); }
  Schedule(const Schedule&) = delete;
  Schedule& operator=(const Schedule&) = delete;

  // Runs the merge on a new thread after the previous one has ended. Throws std::system_error when
  // the system cannot create a thread.
  void startMerge(std::function<void()> merge) TL_EXCLUDES(_threadMutex, _mutex);
  // Waits for the thread of the last merge.
  void join() TL_EXCLUDES(_threadMutex);

  // Called on the merge thread before a merge begins. Each merge rewrites a whole shard, so while
  // mail pours in, fewer and larger merges cost less. Waits until the hot part is half as large as
  // the shard, within bounds that keep scans of the hot part fast. When no mail pours in, the merge
  // begins after a quarter of a second.
  void waitForMore(uint32_t maxHotSuffixes, uint64_t shardSuffixes,
                   const std::function<uint64_t()>& hotSuffixes) TL_EXCLUDES(_mutex);
  // Ends the wait of the merge that is about to begin, if any.
  void mergeAtOnce() TL_EXCLUDES(_mutex);
  // Waits until no merge waits or runs.
  void waitForMerge() TL_EXCLUDES(_mutex);

  // Waits while a merge or a compaction on demand runs.
  void waitForMaintenance();

  // The running scans, which follow one another closely while a user types; and the running merges
  // and compactions on demand.
  [[nodiscard]] Activity& scans() { return _scans; }
  [[nodiscard]] Activity& maintenance() { return _maintenance; }

  // Ends all waits, and merges at their next page, for good.
  void interrupt() TL_EXCLUDES(_mutex);
  [[nodiscard]] bool interrupted() const { return _interrupted; }

 private:
  // False when the wait was ended early.
  [[nodiscard]] bool pause() TL_EXCLUDES(_mutex);
  void setMerging(bool merging) TL_EXCLUDES(_mutex);

  Activity _scans{std::chrono::milliseconds(5)};  // one search makes several scans
  Activity _maintenance;

  platform::Mutex _mutex;
  std::condition_variable_any _changed;
  bool _atOnce TL_GUARDED_BY(_mutex) = false;
  bool _merging TL_GUARDED_BY(_mutex) = false;
  std::atomic<bool> _interrupted{false};  // set under the mutex

  // The thread of the last merge, joined when the next one starts or at the end. The mutex is taken
  // with no other held.
  platform::Mutex _threadMutex TL_ACQUIRED_BEFORE(_mutex);
  std::thread _thread TL_GUARDED_BY(_threadMutex);
};

// Makes a merge give way to scans: while scans run, it waits up to three times as long as it has
// computed. A merge is not urgent, and it would take processor time from the search. Used by the
// merge thread only.
class MergePace {
 public:
  explicit MergePace(Activity& scans);

  // Call it often, at points where the merge holds nothing that others wait for.
  void giveWay();

 private:
  Activity& _scans;
  std::chrono::nanoseconds _computed;  // processor time of the thread already in _credit
  std::chrono::nanoseconds _credit{0};
};

}  // namespace salt
