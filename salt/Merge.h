#pragma once

#include <leveldb/write_batch.h>

#include <cstdint>
#include <string>
#include <vector>

#include "salt/IndexImpl.h"
#include "salt/Postings.h"
#include "salt/Schedule.h"
#include "salt/Suffix.h"
#include "salt/ZoneTextCache.h"

namespace salt {

// Merges the hot part, as of construction, into one shard: two sorted inputs become one sorted run
// of new pages. One thread; the index outlives it.
//
// Crash safety: a batch is written only when every suffix taken so far is in a page of this batch
// or an earlier one, and every old page that it removes has been taken completely. So each suffix
// is always either hot or in exactly one page, as the metrics of the same batch say. Within a batch
// an old page is deleted before a new one is put, which may have the same key.
class Merge {
 public:
  // Without `hot` nothing is merged and no page changes; the shard is only read for its posting
  // lists.
  Merge(index& owner, uint8_t shard, bool hot = true);

  // Runs to the end, or to the first failed read or write or an interruption of the index; what was
  // committed before stays. False when it did not reach the end.
  [[nodiscard]] bool run();

  // After a complete run: ends the posting lists of the shard, false when there are none; then
  // writes their file, false with a log line on failure.
  [[nodiscard]] bool finishPostings();
  [[nodiscard]] bool writePostings(const PostingsOwner& owner) { return _postings.write(owner); }

 private:
  [[nodiscard]] bool oldIsNext();
  void takeOld();
  void takeHot();

  // Appends the cursor's suffix to the pending ones.
  void take(ShardCursor* cursor, bool relateToPrevious);

  // The first bytes of the text of the last suffix taken, which must be long enough.
  [[nodiscard]] std::string_view previousText(size_t bytes);

  [[nodiscard]] std::string_view firstText();

  // Ends a page with the first `count` pending suffixes.
  void flushPage(size_t count);

  // Adds the page of the first `count` pending suffixes to the batch, and the deletion of the old
  // page that it replaces.
  void putPage(size_t count);

  // Writes all pending suffixes as pages, and the batch if it is large enough or `final` is set.
  void commit(bool final);

  index& _idx;
  const uint8_t _shard;
  MergePace _pace;
  const IndexView _oldView;
  const IndexView _hotView;
  ZoneTextCache _zoneTexts;
  leveldb::WriteBatch _batch;
  ShardCursor _old;
  ShardCursor _hot;
  Suffix _previous;  // the last suffix taken
  Suffix _first;     // the first suffix of a page
  PostingsBuilder _postings;
  std::vector<SuffixMeta> _pending;
  std::vector<std::string> _pendingTexts;  // full text of each, or empty where that needs a read
  uint64_t _hotMerged = 0;                 // since the last commit, like _pageDelta
  int64_t _pageDelta = 0;
  const bool _withHot;
  bool _failed = false;
  bool _interrupted = false;
  bool _tookOld = false;
  bool _lastFromHot = false;
  std::string _key;
  std::string _value;
  std::string _oldKey;  // of the old page begun since the last flush, or empty
  std::string _oldValue;
};

}  // namespace salt
