#pragma once

#include <cstdint>
#include <list>
#include <memory>
#include <string>
#include <string_view>
#include <unordered_map>

#include "platform/Mutex.h"

namespace salt {

// What scans have found in the pages, by prefix. While somebody types, the words before the last
// are scanned for again with each letter, and so are single letters and the most common words by
// everybody. Pages change with merges only, which give them another generation.
//
// Memory: kMostBytes; what was not asked for the longest goes first. Any thread.
class ScanMemory {
 public:
  struct Found {
    uint64_t suffixes = 0;  // of live documents
    std::string places;     // see PlaceSet::encode
  };

  // Null when it is not known for this generation.
  [[nodiscard]] std::shared_ptr<const Found> find(std::string_view prefix, uint64_t generation)
      TL_EXCLUDES(_mutex);

  // Nothing of an older generation than the latest is kept.
  void keep(std::string_view prefix, uint64_t generation, std::shared_ptr<const Found> found)
      TL_EXCLUDES(_mutex);

 private:
  struct Entry {
    std::string prefix;
    std::shared_ptr<const Found> found;

    [[nodiscard]] size_t bytes() const { return kOverhead + prefix.size() + found->places.size(); }
  };
  using Entries = std::list<Entry>;

  static constexpr size_t kMostBytes = 16 * 1024 * 1024;
  static constexpr size_t kOverhead = 256;  // list, table and allocator, roughly

  // False when the generation is gone already.
  bool enter(uint64_t generation) TL_REQUIRES(_mutex);

  platform::Mutex _mutex;
  uint64_t _generation TL_GUARDED_BY(_mutex) = 0;
  size_t _bytes TL_GUARDED_BY(_mutex) = 0;
  Entries _entries TL_GUARDED_BY(_mutex);  // asked for last first
  std::unordered_map<std::string_view, Entries::iterator> _byPrefix TL_GUARDED_BY(_mutex);
};

}  // namespace salt
