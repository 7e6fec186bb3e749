#pragma once

#include <leveldb/env.h>

#include <condition_variable>
#include <memory>
#include <string>

#include "platform/Mutex.h"
#include "platform/Queue.h"

namespace salt {

// Brings write-ahead logs to disk in their order.
//
// leveldb itself never syncs a log, and starts a new one whenever a memtable is full. The invariant
// here: nothing is written to a log before the previous log is on disk in full. So at most one log
// is incomplete, and whatever a power loss leaves of it, the operations recovered are the first
// ones, without a gap.
//
// A log is synced in the background once a megabyte of it is unsynced, or a second after its first
// unsynced byte. So writers do not wait long at a change of logs, and little is lost when mail
// stops coming.
//
// Any thread. After a failed sync every write fails: data that the kernel dropped does not come
// back by trying again.
class LogSync {
 public:
  // Opens a second handle to each log through `files`, which must outlive this object.
  explicit LogSync(leveldb::Env* files);
  // Syncs what has been written.
  ~LogSync();
  LogSync(const LogSync&) = delete;
  LogSync& operator=(const LogSync&) = delete;

  // Takes over the log `file` at `path`, just opened by leveldb, and returns the one to write to.
  [[nodiscard]] leveldb::Status follow(const std::string& path,
                                       std::unique_ptr<leveldb::WritableFile> file,
                                       leveldb::WritableFile** log) TL_EXCLUDES(_mutex);

 private:
  class File;
  // The sync state of a log. It has its own handle, so that a sync can run concurrently with
  // writes.
  struct Log {
    std::unique_ptr<leveldb::WritableFile> handle;
    uint64_t written = 0;
    uint64_t synced = 0;
    bool syncing = false;
  };

  // Waits until everything written to the log before this call is on disk.
  [[nodiscard]] leveldb::Status settle(const std::shared_ptr<Log>& log) TL_EXCLUDES(_mutex);
  void wrote(const std::shared_ptr<Log>& log, uint64_t bytes) TL_EXCLUDES(_mutex);
  void syncOnce(const std::shared_ptr<Log>& log) TL_REQUIRES(_mutex);
  // Runs on the queue until everything is on disk.
  void syncInBackground() TL_EXCLUDES(_mutex);

  leveldb::Env* const _files;
  platform::Mutex _mutex;
  std::condition_variable_any _changed;
  std::shared_ptr<Log> _current TL_GUARDED_BY(_mutex);
  leveldb::Status _failure TL_GUARDED_BY(_mutex);
  bool _scheduled TL_GUARDED_BY(_mutex) = false;
  bool _ending TL_GUARDED_BY(_mutex) = false;
  platform::SerialQueue _queue;  // last, so that it ends before what its work uses
};

}  // namespace salt
