#pragma once

#include <leveldb/db.h>
#include <leveldb/iterator.h>

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <unordered_map>

namespace salt {

class index;

// The stored texts of zones, for walks that complete very many suffixes. The suffixes of a shard
// come from few documents, again and again, so that texts are kept in memory. Documents of
// neighbouring numbers mostly share a shard, so that a read that misses goes on for a stretch until
// the memory is full for the first time; a shard with more text than that reads one by one.
//
// Memory: kKeptBytes at most, and one zone. The texts are in two generations: when the
// younger has its half of the bytes it becomes the older, and what was not used since is dropped.
// One thread. The index outlives it.
class ZoneTexts {
 public:
  explicit ZoneTexts(const index& owner);

  // The whole text of a zone, empty when there is none. Lives until the next call.
  [[nodiscard]] std::string_view find(uint32_t docID, uint16_t zoneID);

  // False once a read has failed, which looks like a text that is not there.
  [[nodiscard]] bool good() const { return _iterator->status().ok(); }

 private:
  using Texts = std::unordered_map<uint64_t, std::string>;

  static constexpr size_t kKeptBytes = 32 * 1024 * 1024;
  static constexpr size_t kTextOverhead = 96;  // table and allocator, roughly
  static constexpr size_t kReadAheadBytes = 64 * 1024;

  std::string_view keep(uint64_t id, std::string text);
  std::string_view read(uint32_t docID, uint16_t zoneID);
  void readOn();

  const std::unique_ptr<leveldb::Iterator> _iterator;
  Texts _younger;
  Texts _older;
  size_t _youngerBytes = 0;
  bool _full = false;  // texts have been dropped
};

}  // namespace salt
