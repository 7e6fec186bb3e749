#pragma once

#include <leveldb/env.h>

#include <map>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include "platform/FileDescriptor.h"
#include "platform/TLError.h"

namespace salt {

// A snapshot of the files of one database directory. Tables, which never change, are read through
// file descriptors held open; the small remaining files are copied to memory, and all writes go to
// memory too. Any thread may read. Only the thread that captured the snapshot may create files, as
// opening a database does. On leveldb's background thread file creation fails, because compactions
// would fill the memory with tables; reading still works.
class SnapshotEnv final : public leveldb::EnvWrapper {
 public:
  // Null with an error when the directory or one of the database files cannot be read.
  [[nodiscard]] static std::unique_ptr<SnapshotEnv> capture(const std::string& directory,
                                                            TLErrorOut error);

  leveldb::Status NewRandomAccessFile(const std::string& path,
                                      leveldb::RandomAccessFile** file) override;
  leveldb::Status NewWritableFile(const std::string& path, leveldb::WritableFile** file) override;
  leveldb::Status NewAppendableFile(const std::string& path, leveldb::WritableFile** file) override;
  bool FileExists(const std::string& path) override;
  leveldb::Status GetChildren(const std::string& directory,
                              std::vector<std::string>* names) override;
  leveldb::Status RemoveFile(const std::string& path) override;
  leveldb::Status GetFileSize(const std::string& path, uint64_t* size) override;

 private:
  struct Table {
    platform::FileDescriptor file;
    uint64_t size = 0;
  };

  explicit SnapshotEnv(std::unique_ptr<leveldb::Env> memory);

  // Null when the path is no captured table, or when the database has since written a file of the
  // same name, which takes precedence.
  [[nodiscard]] const Table* table(const std::string& path);
  [[nodiscard]] bool addTable(const std::string& path, TLErrorOut error);
  [[nodiscard]] bool mayWrite() const { return std::this_thread::get_id() == _opener; }
  [[nodiscard]] bool addCopy(const std::string& path, TLErrorOut error);

  const std::unique_ptr<leveldb::Env> _memory;
  std::map<std::string, Table> _tables;  // by path; fixed after capture
  const std::thread::id _opener = std::this_thread::get_id();
};

}  // namespace salt
