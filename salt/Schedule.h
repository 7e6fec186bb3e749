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

// When the background work of an index runs, and which work waits for which. Scans come first and
// wait for nothing here; then comes mail; merges and compactions take the time that is left.
//
//   this waits                       for this                                    at most
//   a merge, before it begins        more mail, while much comes in              60 s
//   a merge, between two pages       scans that run (MergePace)                  3 times its work
//   a batch of mail, before it       a merge or a compaction on demand that      10 s
//   begins                           runs; holding no lock
//   a compaction on demand           the merge that runs                         its end
//   the end of the index             the merge that runs                         its next page
//
// An interruption ends all of these at once. Beneath, BatchWriter keeps writes apart from
// compactions on demand, and LogSync and IndexFiles wait for the disk.
//
// Any thread. The merge's thread is the schedule's, which must be joined before what the merge uses
// goes down.
class Schedule {
 public:
  Schedule() = default;
  ~Schedule() { join(); }
  Schedule(const Schedule&) = delete;
  Schedule& operator=(const Schedule&) = delete;

  // Runs the merge on a thread of its own, after the latest one has ended. Throws std::system_error
  // when the system has no thread.
  void startMerge(std::function<void()> merge) TL_EXCLUDES(_threadMutex, _mutex);
  // Waits for the thread of the latest merge.
  void join() TL_EXCLUDES(_threadMutex);

  // Of a merge about to begin, on its thread. Each merge rewrites a whole shard, so that while mail
  // pours in fewer and larger ones cost less: it waits until the hot part is half as large as the
  // shard, within bounds that searches set, since what is hot takes longer to scan. Otherwise it
  // begins after a quarter of a second.
  void waitForMore(uint32_t maxHotSuffixes, uint64_t shardSuffixes,
                   const std::function<uint64_t()>& hotSuffixes) TL_EXCLUDES(_mutex);
  // Ends the wait of the merge that is about to begin, if there is one.
  void mergeAtOnce() TL_EXCLUDES(_mutex);
  // Waits until no merge waits or runs.
  void waitForMerge() TL_EXCLUDES(_mutex);

  // Waits while a merge or a compaction on demand runs.
  void waitForHousekeeping();

  // What is going on: searches, which follow one another closely while somebody types; and merges
  // and compactions on demand.
  [[nodiscard]] Activity& scans() { return _scans; }
  [[nodiscard]] Activity& housekeeping() { return _housekeeping; }

  // Ends all waiting, and merges at their next page, for good.
  void interrupt() TL_EXCLUDES(_mutex);
  [[nodiscard]] bool interrupted() const { return _interrupted; }

 private:
  // False when the wait has been ended.
  [[nodiscard]] bool pause() TL_EXCLUDES(_mutex);
  void setMerging(bool merging) TL_EXCLUDES(_mutex);

  Activity _scans{std::chrono::milliseconds(5)};  // one search makes several
  Activity _housekeeping;

  platform::Mutex _mutex;
  std::condition_variable_any _changed;
  bool _atOnce TL_GUARDED_BY(_mutex) = false;
  bool _merging TL_GUARDED_BY(_mutex) = false;
  std::atomic<bool> _interrupted{false};  // set under the mutex

  // The latest merge's. A finished one is joined when the next starts, or at the end. The mutex is
  // taken with no other held.
  platform::Mutex _threadMutex TL_ACQUIRED_BEFORE(_mutex);
  std::thread _thread TL_GUARDED_BY(_threadMutex);
};

// Has a merge give way to scans: while some run it waits, up to three times as long as it has
// computed. A merge is in no hurry, and what it computes beside a search it takes from the search.
// One thread, that of the merge.
class MergePace {
 public:
  explicit MergePace(Activity& scans);

  // To be called again and again, where the merge holds nothing that others wait for.
  void giveWay();

 private:
  Activity& _scans;
  std::chrono::nanoseconds _computed;  // the thread's, as far as _credit has it
  std::chrono::nanoseconds _credit{0};
};

}  // namespace salt
