#include "salt/LogSync.h"

#include <chrono>
#include <utility>

namespace salt {

namespace {

using Clock = std::chrono::steady_clock;

constexpr uint64_t kMaxUnsynced = 1024 * 1024;  // bytes; more are synced at once
constexpr std::chrono::seconds kMaxAge{1};      // of an unsynced byte

}  // namespace

class LogSync::File final : public leveldb::WritableFile {
 public:
  File(LogSync* owner, std::unique_ptr<leveldb::WritableFile> file, std::shared_ptr<Log> log,
       std::shared_ptr<Log> previous)
      : _owner(*owner),
        _file(std::move(file)),
        _log(std::move(log)),
        _previous(std::move(previous)) {}

  // leveldb holds no lock here that readers need.
  leveldb::Status Append(const leveldb::Slice& bytes) override {
    if (_previous != nullptr) {
      if (const leveldb::Status status = _owner.settle(_previous); !status.ok()) return status;
      _previous = nullptr;
    }
    _unflushed += bytes.size();
    return _file->Append(bytes);
  }
  leveldb::Status Flush() override {
    const leveldb::Status status = _file->Flush();
    if (_unflushed != 0) _owner.wrote(_log, std::exchange(_unflushed, 0));
    return status;
  }
  leveldb::Status Sync() override {
    const leveldb::Status status = Flush();
    return status.ok() ? _owner.settle(_log) : status;
  }
  leveldb::Status Close() override { return _file->Close(); }

 private:
  LogSync& _owner;
  const std::unique_ptr<leveldb::WritableFile> _file;
  const std::shared_ptr<Log> _log;
  std::shared_ptr<Log> _previous;  // until it is known to be on disk
  uint64_t _unflushed = 0;
};

LogSync::LogSync(leveldb::Env* files)
    : _files(files), _queue("tallow-logs", platform::QueuePriority::background) {}

LogSync::~LogSync() {
  std::shared_ptr<Log> last;
  {
    platform::MutexLock lock(_mutex);
    _ending = true;
    last = _current;
  }
  _changed.notify_all();
  if (last != nullptr) (void)settle(last);
}

leveldb::Status LogSync::follow(const std::string& path,
                                std::unique_ptr<leveldb::WritableFile> file,
                                leveldb::WritableFile** log) {
  leveldb::WritableFile* handle = nullptr;
  const leveldb::Status status = _files->NewAppendableFile(path, &handle);
  if (!status.ok()) return status;
  auto followed = std::make_shared<Log>();
  followed->handle.reset(handle);
  platform::MutexLock lock(_mutex);
  *log = new File(this, std::move(file), followed, std::exchange(_current, followed));
  return status;
}

leveldb::Status LogSync::settle(const std::shared_ptr<Log>& log) {
  platform::MutexLock lock(_mutex);
  const uint64_t upTo = log->written;
  while (log->synced < upTo && _failure.ok()) {
    if (log->syncing) {
      _changed.wait(_mutex);
    } else {
      syncOnce(log);
    }
  }
  return _failure;
}

void LogSync::syncOnce(const std::shared_ptr<Log>& log) {
  const uint64_t upTo = log->written;
  log->syncing = true;
  _mutex.unlock();
  const leveldb::Status status = log->handle->Sync();
  _mutex.lock();
  log->syncing = false;
  if (status.ok()) {
    log->synced = upTo;
  } else if (_failure.ok()) {
    _failure = status;
  }
  _changed.notify_all();
}

void LogSync::wrote(const std::shared_ptr<Log>& log, uint64_t bytes) {
  platform::MutexLock lock(_mutex);
  log->written += bytes;
  if (!_scheduled) {
    // If no thread is available, the next write tries again.
    _scheduled = _queue.async([this] { syncInBackground(); });
  } else if (log->written - log->synced >= kMaxUnsynced) {
    _changed.notify_all();
  }
}

void LogSync::syncInBackground() {
  platform::MutexLock lock(_mutex);
  while (!_ending && _failure.ok()) {
    const std::shared_ptr<Log> log = _current;
    if (log->synced == log->written) break;
    const auto deadline = Clock::now() + kMaxAge;
    const auto due = [&]() TL_REQUIRES(_mutex) {
      return _ending || _current != log || log->written - log->synced >= kMaxUnsynced;
    };
    while (!due() && _changed.wait_until(_mutex, deadline) != std::cv_status::timeout) {
    }
    if (_ending) break;
    if (log->syncing) {
      _changed.wait(_mutex);  // the sync of another thread ends with a notification
    } else {
      syncOnce(log);
    }
  }
  _scheduled = false;
}

}  // namespace salt
