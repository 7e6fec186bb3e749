#pragma once

#include <leveldb/write_batch.h>

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "salt/IndexImpl.h"
#include "salt/Suffix.h"
#include "salt/ZoneTextCache.h"

namespace salt {

// Writes a database with the live documents of an index, in key order: hot suffixes, pages, texts,
// records. Each suffix stays in its shard, so scans return the same in the same order. A page
// without suffixes of dead documents is copied unchanged; the remains of other pages are joined
// into pages that are at least half full, taking two neighbours together.
//
// The copy has an empty set of deleted documents. MaxDocID is kept, so that no DocID is reused. One
// thread; the index outlives it and is not changed.
class LiveCopy {
 public:
  LiveCopy(const index& from, const std::function<bool(uint32_t docID)>& isKept,
           const std::function<void()>& progress);

  // Call it once. See Inspection::copyLive.
  [[nodiscard]] std::optional<uint64_t> write(const std::string& path, TLErrorOut error);

 private:
  [[nodiscard]] bool isLive(uint32_t docID) const {
    return !_view.deleted->contains(docID) && _isKept(docID);
  }
  void copyHotPart();
  void copyShard(uint8_t shard);
  // Takes the next `live` suffixes of the cursor, all of its page, and appends those of live
  // documents to _pending.
  void takePage(size_t live);
  void take(Suffix& suffix);
  void flushPage();
  void putPage(leveldb::Slice key, leveldb::Slice value, size_t suffixes);
  void copyTextsAndRecords();
  // Writes the batch if it is large enough, or if `all` is set.
  void commit(bool all);
  [[nodiscard]] leveldb::Iterator& iterator() const { return *_view.iterators.front(); }

  const index& _from;
  const std::function<bool(uint32_t)>& _isKept;
  const std::function<void()>& _progress;
  const IndexView _view;
  ZoneTextCache _zoneTexts;
  ShardCursor _cursor;
  Suffix _previous;                  // the last one in _pending
  std::vector<SuffixMeta> _pending;  // of the page under construction
  std::string _key;                  // of that page
  std::string _value;
  std::optional<BatchWriter> _writer;
  leveldb::WriteBatch _batch;
  leveldb::Status _status;  // the first failed write
  Index::MetricsBlock _metrics;
  uint64_t _shardSuffixes = 0;
  uint64_t _left = 0;  // number of documents left out
};

}  // namespace salt
