#pragma once

#include <leveldb/db.h>
#include <leveldb/iterator.h>

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <unordered_map>

#include "platform/FileDescriptor.h"
#include "salt/Index.h"

namespace salt {

class index;

// The texts of suffixes, for walks that complete very many of them. The suffixes of a shard come
// from few documents, again and again, and to read one from the database is to decompress the whole
// zone. So each text that was read once is kept, as it is, in a file without a name beside the
// database; the system has it in memory as far as there is memory to spare. Documents of
// neighbouring numbers mostly share a shard: a read from the database goes on for a stretch.
//
// Disk: a quarter of what is free and kMostFileBytes at most; then the file begins anew. Memory:
// some 60 bytes for each zone in the file. Where there can be no file, or it fails, each text is
// read from the database. One thread. The index outlives it.
class ZoneTexts {
 public:
  static constexpr uint64_t kMostFileBytes = uint64_t{1} << 30;

  explicit ZoneTexts(const index& owner, uint64_t mostFileBytes = kMostFileBytes);

  // The cut text of a suffix, empty when there is none. Lives until the next call.
  [[nodiscard]] std::string_view find(const SuffixMeta& meta);

  // False once a read from the database has failed, which looks like a text that is not there.
  [[nodiscard]] bool good() const { return _iterator->status().ok(); }

 private:
  struct Stretch {
    uint64_t begin;  // in the file
    uint32_t bytes;
  };

  static constexpr size_t kReadAheadBytes = 64 * 1024;

  // False when the file cannot be read.
  [[nodiscard]] bool readKept(const Stretch& stretch, const SuffixMeta& meta);
  void readStored(const SuffixMeta& meta);
  // Adds the zone that the iterator stands on to what keepRead writes.
  void addRead(uint64_t id);
  void keepRead();
  void forget();

  const index& _idx;
  const std::unique_ptr<leveldb::Iterator> _iterator;
  platform::FileDescriptor _file;
  uint64_t _mostFileBytes = 0;
  uint64_t _fileBytes = 0;
  std::unordered_map<uint64_t, Stretch> _kept;
  std::string _read;    // texts that are to be written at _fileBytes
  std::string _suffix;  // of the latest call
};

}  // namespace salt
