#pragma once

#include <leveldb/db.h>
#include <leveldb/iterator.h>

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <string_view>
#include <vector>

#include "platform/CrashNote.h"
#include "salt/DocSet.h"
#include "salt/Index.h"
#include "salt/Postings.h"

namespace salt {

class index;

// 0xFF is the first byte of stored texts and named keys.
inline constexpr uint8_t kMaxShardNumber = 0xFE;

// By shard, null where there are none.
using ShardPostings = std::vector<std::shared_ptr<const Postings>>;

// The snapshot that every reader works on: one or more iterators, the metrics and the set of
// deleted documents, all of the same moment. Used by one thread, except that each iterator may be
// used by another. The index outlives it.
//
// The iterator alone holds the keys of its moment. A leveldb snapshot would do so too, but while a
// snapshot exists, a compaction keeps a removed key together with its tombstone and may split the
// two into neighbouring files of a level. A later compaction of the first file alone then drops the
// tombstone (leveldb 1.23 looks for such neighbours in the upper level only), and the removed key
// comes back. Single reads use the newest state; this is safe because a stored text only grows,
// after a NUL, so every suffix reads the same.
class IndexView {
 public:
  // Scans fill the block cache and may have several iterators, one per thread. There is only one
  // while suffixes move, because a second could be created after the batch and see another state.
  // With `fillCache` false the reads bypass the block cache, and the constructor waits for a moment
  // between batches.
  IndexView(const index& owner, bool fillCache, size_t iteratorCount = 1);
  // Schedules the removal of files that only this view kept alive.
  ~IndexView();
  IndexView(const IndexView&) = delete;
  IndexView& operator=(const IndexView&) = delete;

  // The last shard to visit; the hot part is shard 0.
  [[nodiscard]] uint8_t lastShard() const;

  // See Index::ForEachZone. A failed read ends it; the status of the first iterator tells.
  void forEachZone(const std::function<bool(uint32_t docID, uint16_t zoneID,
                                            std::string_view text)>& callback) const;

  const index& idx;
  leveldb::ReadOptions options;
  std::vector<std::unique_ptr<leveldb::Iterator>> iterators;  // none is null
  Index::Metrics metrics;
  std::shared_ptr<const DocSet> deleted;
  std::shared_ptr<const ShardPostings> postings;
  uint64_t pageGeneration = 0;  // 0 when unknown

 private:
  uint64_t _compactionsEnded;  // when the view was taken; unused by scans
  const platform::CrashNote _note;
};

}  // namespace salt
