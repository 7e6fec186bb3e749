#pragma once

#include <leveldb/write_batch.h>

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "salt/IndexImpl.h"
#include "salt/Suffix.h"
#include "salt/ZoneTexts.h"

namespace salt {

// A database with the live documents of an index, written in the order of its keys: hot suffixes,
// pages, texts, records. Each suffix stays in its shard, so that scans give the same in the same
// order. A page without suffixes of other documents is copied as it is; what others leave is joined
// to pages that are at least half full, two neighbours taken together.
//
// The set of deleted documents is empty in the copy. MaxDocID stays, so that no number is given
// twice. One thread; the index outlives it and is not changed.
class LiveCopy {
 public:
  LiveCopy(const index& from, const std::function<bool(uint32_t docID)>& isKept,
           const std::function<void()>& progress);

  // Once. See Inspection::copyLive.
  [[nodiscard]] std::optional<uint64_t> write(const std::string& path, TLErrorOut error);

 private:
  [[nodiscard]] bool isLive(uint32_t docID) const {
    return !_view.deleted->contains(docID) && _isKept(docID);
  }
  void copyHotPart();
  void copyShard(uint8_t shard);
  // Appends the live suffixes of the cursor's page to _pending, and moves to the next page.
  void takePage(size_t live);
  void take(Suffix& suffix);
  void flushPage();
  void putPage(leveldb::Slice key, leveldb::Slice value, size_t suffixes);
  void copyTextsAndRecords();
  // What is in the batch goes out when it is large enough, or `all`.
  void commit(bool all);
  [[nodiscard]] leveldb::Iterator& iterator() const { return *_view.iterators.front(); }

  const index& _from;
  const std::function<bool(uint32_t)>& _isKept;
  const std::function<void()>& _progress;
  const IndexView _view;
  ZoneTexts _zoneTexts;
  ShardCursor _cursor;
  Suffix _previous;                  // the latest in _pending
  std::vector<SuffixMeta> _pending;  // of a page that is begun
  std::string _key;                  // of that page
  std::string _value;
  std::optional<BatchWriter> _writer;
  leveldb::WriteBatch _batch;
  leveldb::Status _status;  // of the first write that failed
  Index::MetricsBlock _metrics;
  uint64_t _shardSuffixes = 0;
  uint64_t _left = 0;  // documents left out
};

}  // namespace salt
