#pragma once

#include <leveldb/db.h>
#include <leveldb/iterator.h>

#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "salt/Index.h"

namespace salt {

class index;
class IndexView;
class ZoneTexts;

// The running state of one decoded suffix. Its text is known up to `size`; beyond that it is read
// from the stored zone when a comparison needs it. One thread. The index outlives it.
class Suffix {
 public:
  // Reads zone texts from `zoneTexts`, or from the database when that is null.
  explicit Suffix(const index& owner, ZoneTexts* zoneTexts = nullptr);
  Suffix(const Suffix&) = delete;
  // Copies the suffix, not where it is read from nor the count of fetches.
  Suffix& operator=(const Suffix& suffix);

  // From a key of the hot part or the first of a page: all is known.
  void fromKey(std::string_view key);

  // The next suffix of a page, from the state of the one before it.
  void fromNextMeta(const SuffixMeta& next);

  // Makes the text complete.
  void fetch();

  // Below 0 when the text sorts before all that begins with `prefix`, 0 when it begins with it,
  // above 0 when it sorts after. Fetches when the known text does not tell.
  [[nodiscard]] int compareWithPrefix(std::string_view prefix);

  // What is known of the text. Lives until the next change.
  [[nodiscard]] std::string_view knownText() const { return {_text.get(), size}; }

  const index& idx;
  const leveldb::ReadOptions options;
  size_t size = 0;
  bool full = true;
  uint64_t fetches = 0;  // zone texts read
  SuffixMeta meta;

 private:
  ZoneTexts* const _zoneTexts;
  const std::unique_ptr<char[]> _text;  // MaxMatchLen bytes
  std::string _zoneText;                // of the latest fetch; kept for its memory
};

// How many bytes the texts of both have in common. Fetches where what is known does not tell.
[[nodiscard]] size_t commonPrefix(Suffix* left, Suffix* right);

// Sets common prefix and extra bytes of `meta`, which is that of `suffix`, for a page in which the
// suffix follows one that it shares `lcp` bytes with.
void relate(Suffix* suffix, size_t lcp, SuffixMeta* meta);

// A walk over the suffixes of one shard at a time, in order, with an iterator of a view. One
// thread. The view outlives it, and so do `zoneTexts`, which walks that complete many suffixes
// give.
class ShardCursor {
 public:
  ShardCursor(const IndexView& view, uint8_t shardNumber, ZoneTexts* zoneTexts = nullptr,
              size_t walk = 0);

  // Goes on with another shard: the cursor stands nowhere and its counts are 0.
  void moveTo(uint8_t shardNumber);

  // Stands on the first suffix of the shard that is not less than `prefix`, a text that is cut
  // already, or on none.
  void seek(std::string_view prefix);
  void seekToFirst();

  // To the next suffix; the cursor must be valid.
  void next();

  // Takes what the iterator stands on.
  void load();

  const index& idx;
  uint8_t shard;
  leveldb::Iterator* const iterator;  // the view's
  std::vector<SuffixMeta> metas;      // of the current page; empty in the hot part
  size_t pos = 0;                     // of the current suffix in metas
  bool valid = false;                 // the cursor stands on a suffix
  Suffix suffix;
  uint64_t loads = 0;  // keys (hot part) or pages loaded

 private:
  [[nodiscard]] bool inShard() const;

  std::string _key;
};

}  // namespace salt
