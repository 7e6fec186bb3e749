#pragma once

#include <leveldb/db.h>
#include <leveldb/iterator.h>

#include <cstddef>
#include <cstdint>
#include <deque>
#include <memory>
#include <string>
#include <string_view>

#include "platform/FileDescriptor.h"
#include "salt/DocPages.h"
#include "salt/Index.h"

namespace salt {

class index;

// A cache of zone texts for operations that complete very many suffixes. The suffixes of a shard
// come from few documents, again and again, and reading one from the database decompresses the
// whole zone. So each text read is kept uncompressed in an unnamed temporary file beside the
// database, which the kernel caches as far as memory allows. Whole documents are read, and those
// that follow, since documents with neighbouring numbers mostly share a shard.
//
// Disk: a quarter of the free space, at most kMaxFileBytes; past that, the file starts over.
// Memory: 12 bytes for each cached zone. When the file cannot be created or used, each text is read
// from the database. One thread. The index outlives it.
class ZoneTextCache {
 public:
  static constexpr uint64_t kMaxFileBytes = uint64_t{1} << 30;

  explicit ZoneTextCache(const index& owner, uint64_t maxFileBytes = kMaxFileBytes);

  // The truncated text of a suffix, empty when absent. Valid until the next call.
  [[nodiscard]] std::string_view find(const SuffixMeta& meta);

  // False after a failed read from the database, for which find() returns an empty text.
  [[nodiscard]] bool good() const { return _iterator->status().ok(); }

 private:
  // Where a text is in the file. The zones of a document follow one another.
  struct Kept {
    uint32_t begin;
    uint32_t bytes;
    uint16_t zoneID;
    bool last;  // of its document
  };

  static constexpr size_t kReadAheadBytes = 64 * 1024;

  // Null when it is not in the file.
  [[nodiscard]] const Kept* find(uint32_t docID, uint16_t zoneID) const;
  // False when the file cannot be read.
  [[nodiscard]] bool readKept(const Kept& kept, const SuffixMeta& meta);
  void readStored(const SuffixMeta& meta);
  // Adds documents from `docID` on to the file.
  void readAhead(uint32_t docID);
  // Writes _read; false on failure.
  bool keepRead();
  void forget();

  const index& _idx;
  const std::unique_ptr<leveldb::Iterator> _iterator;
  platform::FileDescriptor _file;
  uint64_t _maxFileBytes = 0;
  uint64_t _fileBytes = 0;
  DocPages<uint32_t> _firstOf;  // the place in _kept of a document's first zone, from 1; or 0
  std::deque<Kept> _kept;
  std::string _read;    // texts to be written at _fileBytes
  std::string _suffix;  // of the last call
};

}  // namespace salt
