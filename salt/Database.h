#pragma once

#include <leveldb/cache.h>
#include <leveldb/db.h>
#include <leveldb/env.h>
#include <leveldb/write_batch.h>

#include <chrono>
#include <condition_variable>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "platform/Log.h"
#include "platform/Mutex.h"
#include "platform/Queue.h"
#include "platform/TLError.h"
#include "salt/BytewiseComparator.h"
#include "salt/OrderedSyncEnv.h"

namespace salt {

inline constexpr platform::Log Log{platform::kSubsystem, "SALT"};

// Forwards leveldb's messages to the log at debug level, truncated to 99 bytes a line.
class LeveldbLogger final : public leveldb::Logger {
 public:
  void Logv(const char* format, va_list arguments) override;
};

// An open database with everything it depends on; destroyed in the order database, cache,
// logger, comparator, environment.
struct Database {
  std::string path;
  std::unique_ptr<OrderedSyncEnv> env;
  std::unique_ptr<BytewiseComparator> comparator;
  std::unique_ptr<leveldb::Logger> logger;
  std::unique_ptr<leveldb::Cache> cache;
  std::unique_ptr<leveldb::DB> db;  // null when opening failed
  leveldb::Status status;           // of opening
};

// The error of the system that caused a status, such as a lack of descriptors, memory or space, or
// an unreadable disk. Nullopt for a database that is absent or damaged.
[[nodiscard]] std::optional<TLError> systemError(const leveldb::Status& status);

enum class OpenMode { create, existing };

// `create` removes what is at `path` first. Failures are logged. `env` must outlive the database.
[[nodiscard]] Database openDatabase(const std::string& path, OpenMode mode,
                                    leveldb::Env* env = leveldb::Env::Default());

// All writes and compactions go through here. Any thread.
//
// A failed write (a full disk, for example) can leave a torn record in the write-ahead log, and
// recovery ignores everything after a torn record. So the next write starts a new log first, and
// what it acknowledges survives.
//
// leveldb 1.23 ends the process when it fails to flush a memtable during a compaction on demand. So
// no such compaction starts on a nearly full disk or beside another one, and writes that would fill
// the memtable meanwhile wait up to a second. Bulk ingest has already waited, holding no lock (see
// WaitForMaintenance).
//
// leveldb keeps what was written last in its memtable, up to 6 MiB of memory, until more mail
// comes. Here a memtable that may exceed half a megabyte is flushed after `idle` without a write,
// so that a class at rest costs little. Nobody waits for that.
class BatchWriter {
 public:
  static constexpr std::chrono::milliseconds kIdle{10000};

  // The open database must outlive this object.
  explicit BatchWriter(const Database& database, std::chrono::milliseconds idle = kIdle)
      : _database(database), _idle(idle) {}
  ~BatchWriter() TL_EXCLUDES(_mutex);
  BatchWriter(const BatchWriter&) = delete;
  BatchWriter& operator=(const BatchWriter&) = delete;

  // The batch reaches the disk within about a second.
  [[nodiscard]] leveldb::Status write(leveldb::WriteBatch* batch) TL_EXCLUDES(_mutex);

  // Returns once everything written is on disk.
  [[nodiscard]] leveldb::Status sync() TL_EXCLUDES(_mutex);

  // Compacts the keys from `begin` to `end`; null means the first and the last key. Does nothing
  // and returns false, with a log line, with less than 128 MiB free.
  bool compact(const leveldb::Slice* begin, const leveldb::Slice* end) TL_EXCLUDES(_mutex);

  // Writes the memtable to a table, after which leveldb removes obsolete files. Fails like compact.
  bool flush() TL_EXCLUDES(_mutex);

 private:
  // False on timeout.
  [[nodiscard]] bool waitForCompaction(size_t bytes) TL_REQUIRES(_mutex);
  [[nodiscard]] leveldb::Status write(leveldb::WriteBatch* batch, bool sync) TL_EXCLUDES(_mutex);
  void wrote(size_t bytes) TL_REQUIRES(_mutex);
  // False when the object ends first.
  bool waitUntilIdle() TL_EXCLUDES(_mutex);

  const Database& _database;
  const std::chrono::milliseconds _idle;
  platform::Mutex _mutex;
  std::condition_variable_any _compacted;
  bool _compacts TL_GUARDED_BY(_mutex) = false;
  size_t _room TL_GUARDED_BY(_mutex) =
      0;  // bytes that batches may still write during the compaction
  bool _logTorn TL_GUARDED_BY(_mutex) = false;

  std::condition_variable_any _ended;
  bool _ending TL_GUARDED_BY(_mutex) = false;
  bool _flushPlanned TL_GUARDED_BY(_mutex) = false;
  size_t _unflushed TL_GUARDED_BY(_mutex) = 0;  // bytes of batches since the last flush
  std::chrono::steady_clock::time_point _lastWrite TL_GUARDED_BY(_mutex);
  platform::SerialQueue _flushing{"tallow-flush", platform::QueuePriority::low};  // last
};

// With `fillCache` false the reads bypass the block cache.
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
