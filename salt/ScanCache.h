#pragma once

#include <cstdint>
#include <list>
#include <memory>
#include <string>
#include <string_view>
#include <unordered_map>

#include "platform/Mutex.h"
#include "salt/PostingSet.h"

namespace salt {

// An LRU cache of what scans found in the pages, by prefix. While a user types, the words before
// the last are scanned again with each letter, and single letters and the most common words are
// scanned by everybody. Each change to the pages or to the deleted documents starts a new
// generation.
//
// Memory: kMaxBytes. Any thread.
class ScanCache {
 public:
  // Null when the prefix is not cached for this generation.
  [[nodiscard]] std::shared_ptr<const PostingSet> find(std::string_view prefix, uint64_t generation)
      TL_EXCLUDES(_mutex);

  // Ignored unless `generation` is the latest.
  void keep(std::string_view prefix, uint64_t generation, std::shared_ptr<const PostingSet> found)
      TL_EXCLUDES(_mutex);

 private:
  struct Entry {
    std::string prefix;
    std::shared_ptr<const PostingSet> found;

    [[nodiscard]] size_t bytes() const { return kOverhead + prefix.size() + found->bytes(); }
  };
  using Entries = std::list<Entry>;

  static constexpr size_t kMaxBytes = 16 * 1024 * 1024;
  static constexpr size_t kOverhead = 256;  // approximate: list, table and allocator

  // Drops all entries if the generation is newer; false if it is older.
  bool enter(uint64_t generation) TL_REQUIRES(_mutex);

  platform::Mutex _mutex;
  uint64_t _generation TL_GUARDED_BY(_mutex) = 0;
  size_t _bytes TL_GUARDED_BY(_mutex) = 0;
  Entries _entries TL_GUARDED_BY(_mutex);  // most recently used first
  std::unordered_map<std::string_view, Entries::iterator> _byPrefix TL_GUARDED_BY(_mutex);
};

}  // namespace salt
