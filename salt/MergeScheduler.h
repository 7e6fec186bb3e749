#pragma once

#include <cstdint>
#include <optional>

#include "salt/Index.h"
#include "salt/Schedule.h"

namespace salt {

class index;

// Decides when an index merges its hot part, and into which shard; runs the merge and the
// compactions after it, on the thread of the schedule. Any thread. The index outlives it.
class MergeScheduler {
 public:
  explicit MergeScheduler(index& owner) : _idx(owner) {}

  // Starts a merge if one is due and none is running. Throws std::system_error when the system
  // cannot create a thread.
  void mergeIfDue();
  // The same; a merge that is waiting for more suffixes begins at once.
  void mergeAtOnce();
  // See Index::Compact.
  bool compact();

  [[nodiscard]] Schedule& schedule() { return _schedule; }
  [[nodiscard]] const Schedule& schedule() const { return _schedule; }

 private:
  // Records a merge as running and chooses its shard; nullopt when a merge is not due, is already
  // running, or cannot be recorded.
  [[nodiscard]] std::optional<uint8_t> beginMerge();
  [[nodiscard]] bool isDue(const Index::MetricsBlock& counters) const;
  // Chooses the shard of the next merge; counts it if it is new.
  [[nodiscard]] uint8_t chooseShard(Index::MetricsBlock& counters) const;
  void startMerge(uint8_t shard);
  // Runs on the merge thread.
  void runMerge(uint8_t shard);
  void mergeInto(uint8_t shard);
  // Merges the hot part into the shard and rebuilds the shard's posting lists; false when it did
  // not finish. Without `hot` it only builds the posting lists.
  [[nodiscard]] bool mergePages(uint8_t shard, bool hot);
  // Builds posting lists for the shards that have none: never built, or removed as damaged.
  void makeMissingPostings();
  void compactPart(uint8_t shard);

  index& _idx;
  Schedule _schedule;  // joins the merge thread
};

}  // namespace salt
