#pragma once

#include <leveldb/env.h>

#include <condition_variable>
#include <memory>
#include <string>

#include "platform/Mutex.h"
#include "platform/Queue.h"

namespace salt {

// Brings write-ahead logs to the disk in their order.
//
// leveldb never syncs a log by itself, and begins a new one whenever a memtable is full. What holds
// here: nothing is written into a log before the log in front of it is on the disk in full. So at
// most one log is not, and whatever a loss of power leaves of it, the operations found are the
// first ones, without a gap.
//
// So that nobody waits long for that, and little is lost when mail stops coming, a log is synced in
// the background, once a megabyte of it is not on the disk or a second after the first byte that is
// not.
//
// Any thread. After a failed sync every write fails: what the system has dropped of a file does not
// come back by trying again.
class LogSync {
 public:
  // Opens logs a second time with `files`, which outlives this.
  explicit LogSync(leveldb::Env* files);
  // Syncs what is written.
  ~LogSync();
  LogSync(const LogSync&) = delete;
  LogSync& operator=(const LogSync&) = delete;

  // The log `file` at `path`, which leveldb has just opened and writes from now on; takes it.
  [[nodiscard]] leveldb::Status follow(const std::string& path,
                                       std::unique_ptr<leveldb::WritableFile> file,
                                       leveldb::WritableFile** log) TL_EXCLUDES(_mutex);

 private:
  class File;
  // A log as far as syncing goes. The handle is its own, so that a sync runs beside writes.
  struct Log {
    std::unique_ptr<leveldb::WritableFile> handle;
    uint64_t written = 0;
    uint64_t synced = 0;
    bool syncing = false;
  };

  // Waits until all that was written to the log when this was called is on the disk.
  [[nodiscard]] leveldb::Status settle(const std::shared_ptr<Log>& log) TL_EXCLUDES(_mutex);
  void wrote(const std::shared_ptr<Log>& log, uint64_t bytes) TL_EXCLUDES(_mutex);
  void syncOnce(const std::shared_ptr<Log>& log) TL_REQUIRES(_mutex);
  // On the queue, until all is on the disk.
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
