#include "salt/OrderedSyncEnv.h"

#include <string_view>
#include <utility>

#include "platform/Assert.h"
#include "platform/CrashNote.h"
#include "salt/Quarantine.h"

namespace salt {

namespace {

constexpr size_t kMaxUnsyncedTables = 4;

bool isTable(std::string_view path) {
  return path.ends_with(".ldb");
}

bool isLog(std::string_view path) {
  return path.ends_with(".log");
}

bool isManifest(std::string_view path) {
  return path.substr(path.rfind('/') + 1).starts_with("MANIFEST-");
}

}  // namespace

// leveldb syncs a table when it is complete and then closes it.
class OrderedSyncEnv::Table final : public leveldb::WritableFile {
 public:
  Table(OrderedSyncEnv* env, leveldb::WritableFile* file) : _env(*env), _file(file) {}

  leveldb::Status Append(const leveldb::Slice& bytes) override { return _file->Append(bytes); }
  // leveldb flushes after each block, but nobody reads a table before it is complete.
  leveldb::Status Flush() override { return {}; }

  // From here on everything can be read.
  leveldb::Status Sync() override {
    _complete = true;
    return _file->Flush();
  }

  leveldb::Status Close() override {
    if (!_complete) return _file->Close();
    _env.finish(std::move(_file));
    return {};
  }

 private:
  OrderedSyncEnv& _env;
  std::unique_ptr<leveldb::WritableFile> _file;  // null after closing
  bool _complete = false;
};

class OrderedSyncEnv::Manifest final : public leveldb::WritableFile {
 public:
  Manifest(OrderedSyncEnv* env, leveldb::WritableFile* file) : _env(*env), _file(file) {}

  leveldb::Status Append(const leveldb::Slice& bytes) override {
    return later([file = _file, copy = bytes.ToString()] { return file->Append(copy); });
  }
  leveldb::Status Flush() override {
    return later([file = _file] { return file->Flush(); });
  }
  leveldb::Status Sync() override {
    return later([file = _file] { return file->Sync(); });
  }
  leveldb::Status Close() override {
    return later([file = _file] { return file->Close(); });
  }

 private:
  leveldb::Status later(Step step) {
    _env.inOrder(std::move(step));
    return _env.failure();
  }

  OrderedSyncEnv& _env;
  const std::shared_ptr<leveldb::WritableFile> _file;  // shared with the queued steps
};

class OrderedSyncEnv::RecoveredLog final : public leveldb::SequentialFile {
 public:
  RecoveredLog(OrderedSyncEnv* env, leveldb::SequentialFile* file) : _env(*env), _file(file) {}

  leveldb::Status Read(size_t size, leveldb::Slice* result, char* scratch) override {
    const leveldb::Status status = _file->Read(size, result, scratch);
    _env.fail(status);
    return status;
  }
  leveldb::Status Skip(uint64_t size) override {
    const leveldb::Status status = _file->Skip(size);
    _env.fail(status);
    return status;
  }

 private:
  OrderedSyncEnv& _env;
  const std::unique_ptr<leveldb::SequentialFile> _file;
};

OrderedSyncEnv::OrderedSyncEnv(const std::string& path, leveldb::Env* base)
    : EnvWrapper(base),
      _crashNotes(crashNotesPath(path)),
      _logs(base),
      _steps("tallow-files"),
      _work("tallow-leveldb", platform::QueuePriority::background,
            platform::SerialQueue::kForever) {}

leveldb::Status OrderedSyncEnv::NewSequentialFile(const std::string& path,
                                                  leveldb::SequentialFile** file) {
  const leveldb::Status status = target()->NewSequentialFile(path, file);
  if (!isLog(path)) return status;
  fail(status);
  if (status.ok()) *file = new RecoveredLog(this, *file);
  return status;
}

leveldb::Status OrderedSyncEnv::NewWritableFile(const std::string& path,
                                                leveldb::WritableFile** file) {
  if (isToBeRemoved(path)) waitForDisk();
  const leveldb::Status status = target()->NewWritableFile(path, file);
  return status.ok() ? wrap(path, file) : status;
}

leveldb::Status OrderedSyncEnv::NewAppendableFile(const std::string& path,
                                                  leveldb::WritableFile** file) {
  const leveldb::Status status = target()->NewAppendableFile(path, file);
  return status.ok() ? wrap(path, file) : status;
}

leveldb::Status OrderedSyncEnv::wrap(const std::string& path, leveldb::WritableFile** file) {
  if (isTable(path)) {
    *file = new Table(this, *file);
  } else if (isManifest(path)) {
    *file = new Manifest(this, *file);
  } else if (isLog(path)) {
    return _logs.follow(path, std::unique_ptr<leveldb::WritableFile>(*file), file);
  }
  return {};
}

// A failed removal is ignored: after each compaction leveldb removes again whatever it finds and
// does not need.
leveldb::Status OrderedSyncEnv::RemoveFile(const std::string& path) {
  {
    const platform::MutexLock lock(_mutex);
    _removals.insert(path);
  }
  inOrder([this, path] {
    (void)target()->RemoveFile(path);
    const platform::MutexLock lock(_mutex);
    _removals.erase(_removals.find(path));
    return leveldb::Status();
  });
  return {};
}

bool OrderedSyncEnv::isToBeRemoved(const std::string& path) {
  const platform::MutexLock lock(_mutex);
  return _removals.contains(path);
}

void OrderedSyncEnv::waitForDisk() {
  _steps.drain();
}

leveldb::Status OrderedSyncEnv::RenameFile(const std::string& from, const std::string& to) {
  waitForDisk();
  const leveldb::Status status = failure();
  return status.ok() ? target()->RenameFile(from, to) : status;
}

leveldb::Status OrderedSyncEnv::UnlockFile(leveldb::FileLock* lock) {
  waitForDisk();
  return target()->UnlockFile(lock);
}

void OrderedSyncEnv::Schedule(void (*work)(void*), void* argument) {
  // leveldb calls this with its mutex held, and the work takes that mutex, so it must not run on
  // this thread.
  TL_ASSERT(_work.async([this, work, argument] {
    const platform::CrashNote note(_crashNotes);
    work(argument);
  }));
}

void OrderedSyncEnv::inOrder(Step step) {
  _steps.submit([this, step = std::move(step)] {
    if (!failure().ok()) return;
    fail(step());
  });
}

void OrderedSyncEnv::fail(const leveldb::Status& status) {
  platform::MutexLock lock(_mutex);
  if (_failure.ok()) _failure = status;
}

leveldb::Status OrderedSyncEnv::failure() {
  platform::MutexLock lock(_mutex);
  return _failure;
}

void OrderedSyncEnv::finish(std::unique_ptr<leveldb::WritableFile> table) {
  {
    platform::MutexLock lock(_mutex);
    while (_tables == kMaxUnsyncedTables) _tableDone.wait(_mutex);
    ++_tables;
  }
  inOrder([file = std::shared_ptr<leveldb::WritableFile>(std::move(table))] {
    const leveldb::Status status = file->Sync();
    const leveldb::Status closed = file->Close();
    return status.ok() ? closed : status;
  });
  _steps.submit([this] {
    platform::MutexLock lock(_mutex);
    --_tables;
    _tableDone.notify_one();
  });
}

}  // namespace salt
