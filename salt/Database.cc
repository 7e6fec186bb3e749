#include "salt/Database.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdarg>
#include <cstdio>
#include <cstring>

#include "platform/CrashNote.h"
#include "platform/Files.h"
#include "platform/Memory.h"

namespace salt {

namespace {

constexpr size_t kWriteBufferBytes = 6 * 1024 * 1024;  // leveldb flushes a memtable of this size
constexpr size_t kBlockCacheBytes = 1024 * 1024;
constexpr size_t kBlockBytes = 32 * 1024;
constexpr size_t kFileBytes = 4 * 1024 * 1024;
constexpr size_t kLogLineBytes = 100;
constexpr uint64_t kCompactionRoom = 128 * 1024 * 1024;  // more than one compaction needs at a time
// A batch takes up to three times its size in a memtable.
constexpr size_t kBatchesBesideCompaction = kWriteBufferBytes / 4;
constexpr size_t kSmallMemtable = 128 * 1024;  // as bytes of batches; not flushed
constexpr std::chrono::seconds kMaxWait{1};    // with locks held that searches need

leveldb::Status open(const leveldb::Options& options, const std::string& path,
                     std::unique_ptr<leveldb::DB>* db) {
  leveldb::DB* opened = nullptr;
  const leveldb::Status status = leveldb::DB::Open(options, path, &opened);
  db->reset(opened);
  return status;
}

// The log of a process that died can end with a torn record. If leveldb reused that log, it would
// append after the torn record, where the next recovery does not look: batches acknowledged after
// reopening would be lost. So the first open recovers into a table and a new log, and only the
// second one reuses logs.
leveldb::Status openExisting(leveldb::Options options, const std::string& path,
                             std::unique_ptr<leveldb::DB>* db) {
  options.reuse_logs = false;
  if (const leveldb::Status status = open(options, path, db); !status.ok()) return status;
  db->reset();
  options.reuse_logs = true;
  return open(options, path, db);
}

}  // namespace

void LeveldbLogger::Logv(const char* format, va_list arguments) {
  static constexpr platform::Log log{platform::kSubsystem, "LevelDB"};
  if (!log.enabled(platform::LogLevel::debug)) return;
  char line[kLogLineBytes];
  std::vsnprintf(line, sizeof line, format, arguments);
  log.debug("{}", static_cast<const char*>(line));
}

BatchWriter::~BatchWriter() {
  {
    platform::MutexLock lock(_mutex);
    _ending = true;
  }
  _ended.notify_all();
}

bool BatchWriter::compact(const leveldb::Slice* begin, const leveldb::Slice* end) {
  if (const uint64_t free = platform::freeBytes(_database.path); free < kCompactionRoom) {
    Log.error("No compaction: {} bytes are left on the disk", free);
    return false;
  }
  {
    platform::MutexLock lock(_mutex);
    while (_compacts) _compacted.wait(_mutex);
    _compacts = true;
    _room = kBatchesBesideCompaction;
  }
  _database.db->CompactRange(begin, end);  // begins with a new memtable
  platform::MutexLock lock(_mutex);
  _compacts = false;
  _compacted.notify_all();
  return true;
}

bool BatchWriter::waitForCompaction(size_t bytes) {
  const auto deadline = std::chrono::steady_clock::now() + kMaxWait;
  while (_compacts && (_logTorn || bytes > _room)) {
    if (_compacted.wait_until(_mutex, deadline) == std::cv_status::timeout) return false;
  }
  return true;
}

leveldb::Status BatchWriter::write(leveldb::WriteBatch* batch) {
  return write(batch, false);
}

// An empty batch, because leveldb takes a null batch as the request to flush the memtable.
leveldb::Status BatchWriter::sync() {
  leveldb::WriteBatch empty;
  return write(&empty, true);
}

leveldb::Status BatchWriter::write(leveldb::WriteBatch* batch, bool sync) {
  platform::MutexLock lock(_mutex);
  const size_t bytes = batch->ApproximateSize();
  if (_compacts && !waitForCompaction(bytes) && _logTorn) {
    return leveldb::Status::IOError("no new log beside a compaction");
  }
  _room -= std::min(bytes, _room);
  leveldb::Status status;
  if (_logTorn) status = _database.db->Write(leveldb::WriteOptions(), nullptr);
  if (!status.ok()) return status;
  leveldb::WriteOptions options;
  options.sync = sync;
  status = _database.db->Write(options, batch);
  _logTorn = !status.ok();
  wrote(bytes);
  return status;
}

// A compaction of the range after the last key flushes the memtable and does nothing else.
bool BatchWriter::flush() {
  const leveldb::Slice behind("\xFF\xFF", 2);
  return compact(&behind, &behind);
}

void BatchWriter::wrote(size_t bytes) {
  _unflushed += bytes;
  _lastWrite = std::chrono::steady_clock::now();
  if (_flushPlanned || _unflushed < kSmallMemtable) return;
  // If no thread is available, the next write tries again.
  _flushPlanned = _flushing.async([this] {
    if (waitUntilIdle() && flush()) platform::returnFreeMemory();
  });
}

bool BatchWriter::waitUntilIdle() {
  platform::MutexLock lock(_mutex);
  while (!_ending && _lastWrite + _idle > std::chrono::steady_clock::now()) {
    _ended.wait_until(_mutex, _lastWrite + _idle);
  }
  _flushPlanned = false;
  _unflushed = 0;
  return !_ending;
}

// leveldb passes on the text of an errno but not its number. All of its I/O errors come from the
// system, except for missing files, which it reports separately.
std::optional<TLError> systemError(const leveldb::Status& status) {
  if (!status.IsIOError()) return std::nullopt;
  const std::string text = status.ToString();
  for (const int code :
       {EMFILE, ENFILE, ENOMEM, EAGAIN, ENOSPC, EDQUOT, EROFS, EACCES, EPERM, EINTR}) {
    if (text.ends_with(std::strerror(code))) return platform::posixError(code, text);
  }
  return platform::posixError(EIO, text);
}

Database openDatabase(const std::string& path, OpenMode mode, leveldb::Env* env) {
  Database result;
  result.path = path;
  result.comparator = std::make_unique<BytewiseComparator>();
  result.logger = std::make_unique<LeveldbLogger>();
  result.cache.reset(leveldb::NewLRUCache(kBlockCacheBytes));
  result.env = std::make_unique<OrderedSyncEnv>(path, env);
  const platform::CrashNote note(result.env->crashNotes());
  leveldb::Options options;
  options.env = result.env.get();
  options.comparator = result.comparator.get();
  options.write_buffer_size = kWriteBufferBytes;
  options.block_cache = result.cache.get();
  options.block_size = kBlockBytes;
  options.max_file_size = kFileBytes;
  options.reuse_logs = true;
  options.info_log = result.logger.get();
  leveldb::Status status;
  if (!result.env->start()) {
    status = leveldb::Status::IOError(path, std::strerror(EAGAIN));
  } else if (mode == OpenMode::create) {
    platform::removeItem(path, nullptr);
    options.create_if_missing = true;
    options.error_if_exists = true;
    status = open(options, path, &result.db);
  } else {
    status = openExisting(options, path, &result.db);
  }
  if (!status.ok()) Log.error("Error opening db: {}", status.ToString());
  result.status = status;
  return result;
}

}  // namespace salt
