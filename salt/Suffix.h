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
class ZoneTextCache;

// A decoded suffix. Its text is known up to `size`; the rest is read from the stored zone when a
// comparison needs it. One thread. The index outlives it.
class Suffix {
 public:
  // Reads zone texts through `zoneTexts`, or from the database when that is null.
  explicit Suffix(const index& owner, ZoneTextCache* zoneTexts = nullptr);
  Suffix(const Suffix&) = delete;
  // Copies the suffix, but neither its text source nor its fetch count.
  Suffix& operator=(const Suffix& suffix);

  // Decodes a key of the hot part or the first key of a page, which has the full text.
  void fromKey(std::string_view key);

  // Moves on to the next suffix of a page, from the state of the previous one.
  void fromNextMeta(const SuffixMeta& next);

  // Completes the text.
  void fetch();

  // Negative when the text sorts before everything that begins with `prefix`, 0 when it begins with
  // it, positive when it sorts after. Fetches when the known text cannot decide.
  [[nodiscard]] int compareWithPrefix(std::string_view prefix);

  // The known text, valid until the next change.
  [[nodiscard]] std::string_view knownText() const { return {_text.get(), size}; }

  const index& idx;
  const leveldb::ReadOptions options;
  size_t size = 0;
  bool full = true;
  uint64_t fetches = 0;  // zone texts read
  SuffixMeta meta;

 private:
  ZoneTextCache* const _zoneTexts;
  const std::unique_ptr<char[]> _text;  // MaxMatchLen bytes
  std::string _zoneText;                // of the last fetch; reused to avoid allocation
};

// The number of bytes that the two texts share. Fetches when the known texts cannot decide.
[[nodiscard]] size_t commonPrefix(Suffix* left, Suffix* right);

// Sets the common prefix and extra bytes of `meta`, the metadata of `suffix`, for a page in which
// it follows a suffix with which it shares `lcp` bytes.
void relate(Suffix* suffix, size_t lcp, SuffixMeta* meta);

// Iterates over the suffixes of one shard at a time, in order, with an iterator of a view. One
// thread. The view and `zoneTexts`, which callers that complete many suffixes pass, outlive it.
class ShardCursor {
 public:
  ShardCursor(const IndexView& view, uint8_t shardNumber, ZoneTextCache* zoneTexts = nullptr,
              size_t iteratorIndex = 0);

  // Switches to another shard: the cursor becomes invalid and its counts 0.
  void moveTo(uint8_t shardNumber);

  // Moves to the first suffix of the shard that is not less than `prefix`, which must be truncated
  // already; the cursor is invalid if there is none.
  void seek(std::string_view prefix);
  void seekToFirst();

  // Moves to the next suffix; the cursor must be valid.
  void next();

  // Loads the key or page at the iterator.
  void load();

  const index& idx;
  uint8_t shard;
  leveldb::Iterator* const iterator;  // the view's
  std::vector<SuffixMeta> metas;      // of the current page; empty in the hot part
  size_t pos = 0;                     // index of the current suffix in metas
  bool valid = false;                 // the cursor stands on a suffix
  Suffix suffix;
  uint64_t loads = 0;  // keys (hot part) or pages loaded

 private:
  [[nodiscard]] bool inShard() const;

  std::string _key;
};

}  // namespace salt
