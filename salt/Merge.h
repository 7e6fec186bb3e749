#pragma once

#include <leveldb/write_batch.h>

#include <cstdint>
#include <string>
#include <vector>

#include "salt/IndexImpl.h"
#include "salt/Postings.h"
#include "salt/Schedule.h"
#include "salt/Suffix.h"
#include "salt/ZoneTexts.h"

namespace salt {

// Merges the hot part, as it is when the merge is made, into one shard: two sorted walks become one
// run of new pages. One thread; the index outlives it.
//
// What holds over a crash: a batch is written only when every suffix taken so far is in a page of
// it or of one before, and every old page that it removes has been taken in full. So each suffix is
// at any moment either hot or in one page, and the metrics of the same batch say so. Within a batch
// an old page is removed before a new one is put that may have its key.
class Merge {
 public:
  // Without `hot` nothing is merged, and no page changes: the shard is gone through for its
  // postings.
  Merge(index& owner, uint8_t shard, bool hot = true);

  // To the end, or to the first read or write that fails, or an interruption of the index; what was
  // committed until then stays. False when it did not come to the end.
  [[nodiscard]] bool run();

  // After a run to the end: the bytes of the shard's new postings, empty for none.
  [[nodiscard]] std::string postings(const PostingsOwner& owner);

 private:
  [[nodiscard]] bool oldIsNext();
  void takeOld();
  void takeHot();

  // Appends the cursor's suffix to the pending ones.
  void take(ShardCursor* cursor, bool relateToPrevious);

  // The first bytes of the latest one taken, which has that many.
  [[nodiscard]] std::string_view previousText(size_t bytes);

  [[nodiscard]] std::string_view firstText();

  // Puts the first `count` pending suffixes into a page.
  void flushPage(size_t count);

  // Writes the page of _key and _value, and removes the old page that it replaces.
  void putPage();

  // Puts all that is pending into pages, and writes the batch if it is large enough or the last.
  void commit(bool final);

  index& _idx;
  const uint8_t _shard;
  MergePace _pace;
  const IndexView _oldView;
  const IndexView _hotView;
  ZoneTexts _zoneTexts;
  leveldb::WriteBatch _batch;
  ShardCursor _old;
  ShardCursor _hot;
  Suffix _previous;  // the latest one taken
  Suffix _first;     // of a page
  PostingsBuilder _postings;
  std::vector<SuffixMeta> _pending;
  std::vector<std::string> _pendingTexts;  // of each, in full, or empty where it would be a read
  uint64_t _hotMerged = 0;                 // since the latest commit, like _pageDelta
  int64_t _pageDelta = 0;
  const bool _withHot;
  bool _failed = false;
  bool _interrupted = false;
  bool _tookOld = false;
  bool _lastFromHot = false;
  std::string _key;
  std::string _value;
  std::string _oldKey;  // of the old page begun since the latest flush, or empty
  std::string _oldValue;
};

}  // namespace salt
