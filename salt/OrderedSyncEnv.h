#pragma once

#include <leveldb/env.h>

#include <condition_variable>
#include <functional>
#include <memory>
#include <set>
#include <string>

#include "platform/Mutex.h"
#include "platform/Queue.h"
#include "salt/LogSync.h"

namespace salt {

// The environment of one open database: its files and its background thread.
//
// leveldb's background thread syncs each table it has written and each entry of the manifest, which
// lists the current tables. Here a thread of its own does these steps, while leveldb goes on: it
// syncs tables, appends to the manifest and syncs it, and removes files, in the order in which
// leveldb requested them.
//
// Invariant: at any moment the directory is one that leveldb's own order of calls could have left.
// A table is on disk before the manifest lists it, and a file is removed only after the manifest
// that makes it obsolete is on disk. Logs reach the disk in their order too (see LogSync). After
// the first failure no further step runs, appends to the manifest fail, and leveldb refuses writes;
// all logs and tables that the last good manifest needs still exist.
//
// leveldb's background work runs on this database's own thread; leveldb's default environment
// shares one among all databases of the process.
//
// Any thread. Outlives the database; the destructor ends both threads.
class OrderedSyncEnv final : public leveldb::EnvWrapper {
 public:
  // For the database in the directory `path`. Does all file operations through `base`, which must
  // outlive this object.
  OrderedSyncEnv(const std::string& path, leveldb::Env* base);

  // The file that records that the process crashed during work on this database (see
  // platform::CrashNote).
  [[nodiscard]] const std::string& crashNotes() const { return _crashNotes; }

  // Starts leveldb's background thread; call it before opening the database. False when the system
  // cannot create a thread.
  [[nodiscard]] bool start() { return _work.start(); }

  // On recovery leveldb skips a log that it cannot read, and removes it afterwards. Here a failed
  // read counts as a failure like any other, so the log stays.
  leveldb::Status NewSequentialFile(const std::string& path,
                                    leveldb::SequentialFile** file) override;
  // A new file may have the same name as one left by a killed process whose removal is still queued
  // since the database was opened. Waits for that removal, so that it does not delete the new file.
  leveldb::Status NewWritableFile(const std::string& path, leveldb::WritableFile** file) override;
  leveldb::Status NewAppendableFile(const std::string& path, leveldb::WritableFile** file) override;
  leveldb::Status RemoveFile(const std::string& path) override;
  void Schedule(void (*work)(void*), void* argument) override;

  // Waits until all queued steps are on disk. The next two wait as well: RenameFile makes a
  // manifest the current one, UnlockFile lets others open the database.
  void waitForDisk();
  leveldb::Status RenameFile(const std::string& from, const std::string& to) override;
  leveldb::Status UnlockFile(leveldb::FileLock* lock) override;

 private:
  class Table;
  class Manifest;
  class RecoveredLog;
  using Step = std::function<leveldb::Status()>;

  // Replaces `file`, just opened by leveldb, with a wrapper for its kind; takes ownership.
  [[nodiscard]] leveldb::Status wrap(const std::string& path, leveldb::WritableFile** file);
  [[nodiscard]] bool isToBeRemoved(const std::string& path) TL_EXCLUDES(_mutex);
  // Runs the step after all earlier ones, unless one of them has failed.
  void inOrder(Step step);
  // The first failure, which is permanent.
  [[nodiscard]] leveldb::Status failure() TL_EXCLUDES(_mutex);
  void fail(const leveldb::Status& status) TL_EXCLUDES(_mutex);
  // Queues the sync and close of a complete table; takes ownership. Waits while too many tables are
  // not yet on disk.
  void finish(std::unique_ptr<leveldb::WritableFile> table) TL_EXCLUDES(_mutex);

  const std::string _crashNotes;
  platform::Mutex _mutex;
  std::condition_variable_any _tableDone;
  std::multiset<std::string> _removals TL_GUARDED_BY(_mutex);  // requested and not done yet
  size_t _tables TL_GUARDED_BY(_mutex) = 0;                    // not yet on disk
  leveldb::Status _failure TL_GUARDED_BY(_mutex);
  LogSync _logs;
  platform::SerialQueue _steps;
  platform::SerialQueue _work;  // destroyed first, because it queues steps
};

}  // namespace salt
