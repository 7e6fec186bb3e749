#pragma once

#include <leveldb/cache.h>
#include <leveldb/db.h>
#include <leveldb/env.h>
#include <leveldb/write_batch.h>

#include <condition_variable>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/Log.h"
#include "platform/Mutex.h"
#include "platform/TLError.h"
#include "salt/IndexFiles.h"
#include "salt/KeyOrder.h"

namespace salt {

inline constexpr platform::Log Log{platform::kSubsystem, "SALT"};

// Passes what leveldb says of itself to the log, at debug level, cut to 99 bytes a line.
class LeveldbLogger final : public leveldb::Logger {
 public:
  void Logv(const char* format, va_list arguments) override;
};

// An open database with what it needs to live; goes down in the order database, cache, logger,
// order, files.
struct Database {
  std::string path;
  std::unique_ptr<IndexFiles> files;
  std::unique_ptr<KeyOrder> order;
  std::unique_ptr<leveldb::Logger> logger;
  std::unique_ptr<leveldb::Cache> cache;
  std::unique_ptr<leveldb::DB> db;  // null when opening failed
  leveldb::Status status;           // of opening
};

// What the system lacks when it is the reason of a failure: descriptors, memory, space, a readable
// disk. None for a database that is not there, or is damaged.
[[nodiscard]] std::optional<TLError> systemError(const leveldb::Status& status);

enum class OpenMode { create, existing };

// `create` removes what is at `path` first. A failure is logged. `files` outlives the database.
[[nodiscard]] Database openDatabase(const std::string& path, OpenMode mode,
                                    leveldb::Env* files = leveldb::Env::Default());

// The only way batches are written and keys compacted. Any thread.
//
// A write that fails (a full disk, say) can leave half a record in the log, and recovery does not
// look behind it: the next write starts a new log first, so that what it acknowledges survives.
//
// leveldb 1.23 ends the process when it fails to write a memtable during a compaction on demand. So
// none begins on a disk that is nearly full or beside another, and writes that would fill the
// memtable meanwhile wait, a second at most: who adds a lot has waited before, holding no lock (see
// WaitWhileTidying).
class BatchWriter {
 public:
  // Of the open database, which outlives this.
  explicit BatchWriter(const Database& database) : _database(database) {}

  // On the disk within a second or so.
  [[nodiscard]] leveldb::Status write(leveldb::WriteBatch* batch) TL_EXCLUDES(_mutex);

  // Returns once all that was written is on the disk.
  [[nodiscard]] leveldb::Status sync() TL_EXCLUDES(_mutex);

  // The keys from `begin` to `end`; null stands for the first and the last. Does nothing and gives
  // false, with a log line, where fewer than 128 MiB are free.
  bool compact(const leveldb::Slice* begin, const leveldb::Slice* end) TL_EXCLUDES(_mutex);

 private:
  // False when it took too long.
  [[nodiscard]] bool waitForCompaction(size_t bytes) TL_REQUIRES(_mutex);
  [[nodiscard]] leveldb::Status write(leveldb::WriteBatch* batch, bool sync) TL_EXCLUDES(_mutex);

  const Database& _database;
  platform::Mutex _mutex;
  std::condition_variable_any _compacted;
  bool _compacts TL_GUARDED_BY(_mutex) = false;
  size_t _room TL_GUARDED_BY(_mutex) = 0;  // for batches, until it has
  bool _logTorn TL_GUARDED_BY(_mutex) = false;
};

// With `fillCache` false the reads do not displace the block cache.
inline leveldb::ReadOptions readOptions(bool fillCache) {
  leveldb::ReadOptions options;
  options.verify_checksums = false;
  options.fill_cache = fillCache;
  return options;
}

inline leveldb::Slice slice(std::string_view bytes) {
  return {bytes.data(), bytes.size()};
}
inline std::string_view view(const leveldb::Slice& bytes) {
  return {bytes.data(), bytes.size()};
}

}  // namespace salt
