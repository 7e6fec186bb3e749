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

// The files and the background thread of one open database.
//
// leveldb's background thread waits for the disk after each table that it has written and after
// each entry of the manifest, which names the tables that count. Here a thread of its own does what
// has to reach the disk in order: it syncs tables, adds to the manifest and syncs it, and removes
// files, all in the order in which leveldb has asked for it, while leveldb goes on. At any moment
// the directory is one that leveldb's own order of calls could have left: tables are on the disk
// before the manifest names them, and nothing is removed before the manifest that makes it obsolete
// is on the disk. Logs are synced in their order, too (see LogSync). With the first failure all of
// this ends, the manifest refuses to grow, and leveldb refuses to write; logs and tables that the
// last good manifest needs are all still there.
//
// leveldb's background work runs on a thread of this database's own: in leveldb's default
// environment all databases of the process share one.
//
// Any thread. Outlives the database; the destructor ends both threads.
class IndexFiles final : public leveldb::EnvWrapper {
 public:
  // The database is in the directory `path`. Makes and reads files with `files`, which outlives
  // this.
  IndexFiles(const std::string& path, leveldb::Env* files);

  // Where it is noted that the process ended at work on this database (see platform::CrashNote).
  [[nodiscard]] const std::string& crashNotes() const { return _crashNotes; }

  // Starts the thread that leveldb works on; before the database is opened. False when the system
  // has none to give.
  [[nodiscard]] bool start() { return _work.start(); }

  // leveldb passes over a log that it cannot read when it recovers, and removes it afterwards. Here
  // a read that fails ends everything as any other failure does, and the log stays.
  leveldb::Status NewSequentialFile(const std::string& path,
                                    leveldb::SequentialFile** file) override;
  // A new file can have the name of one that a killed process has left, whose removal was asked for
  // when the database was opened: that is waited for, so that it does not take the new file.
  leveldb::Status NewWritableFile(const std::string& path, leveldb::WritableFile** file) override;
  leveldb::Status NewAppendableFile(const std::string& path, leveldb::WritableFile** file) override;
  leveldb::Status RemoveFile(const std::string& path) override;
  void Schedule(void (*work)(void*), void* argument) override;

  // Waits for what is still to reach the disk. So do the next two: the first makes a manifest the
  // one that counts, the second lets others open the database.
  void waitForDisk();
  leveldb::Status RenameFile(const std::string& from, const std::string& to) override;
  leveldb::Status UnlockFile(leveldb::FileLock* lock) override;

 private:
  class Table;
  class Manifest;
  class RecoveredLog;
  using Step = std::function<leveldb::Status()>;

  // What leveldb gets for a file that it writes; takes it.
  [[nodiscard]] leveldb::Status wrap(const std::string& path, leveldb::WritableFile** file);
  [[nodiscard]] bool isToBeRemoved(const std::string& path) TL_EXCLUDES(_mutex);
  // Runs the step after all before it, unless one of them has failed.
  void inOrder(Step step);
  // The first failure, which stays.
  [[nodiscard]] leveldb::Status failure() TL_EXCLUDES(_mutex);
  void fail(const leveldb::Status& status) TL_EXCLUDES(_mutex);
  // Has a complete table synced and closed; takes it. Waits while many others are not on the disk
  // yet.
  void finish(std::unique_ptr<leveldb::WritableFile> table) TL_EXCLUDES(_mutex);

  const std::string _crashNotes;
  platform::Mutex _mutex;
  std::condition_variable_any _tableDone;
  std::multiset<std::string> _removals TL_GUARDED_BY(_mutex);  // asked for and not done
  size_t _tables TL_GUARDED_BY(_mutex) = 0;                    // that are not on the disk yet
  leveldb::Status _failure TL_GUARDED_BY(_mutex);
  LogSync _logs;
  platform::SerialQueue _steps;
  platform::SerialQueue _work;  // ends first: it makes steps
};

}  // namespace salt
