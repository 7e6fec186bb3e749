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

// The files of one database directory as they were at one moment. Tables, which never change, are
// read through descriptors that are held open; the small rest is copied to memory, where all that
// is written goes too. Any thread may read; only the one that captured makes files, as opening
// does. Compactions, which leveldb starts on a thread of its own, would fill the memory with
// tables: they fail, and reading goes on.
class FrozenFiles final : public leveldb::EnvWrapper {
 public:
  // Null with an error when the directory or one of the database's files cannot be read.
  [[nodiscard]] static std::unique_ptr<FrozenFiles> capture(const std::string& directory,
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

  explicit FrozenFiles(std::unique_ptr<leveldb::Env> memory);

  // A database that makes a file of the name of a table gets what it wrote.
  [[nodiscard]] const Table* table(const std::string& path);
  [[nodiscard]] bool addTable(const std::string& path, TLErrorOut error);
  [[nodiscard]] bool mayWrite() const { return std::this_thread::get_id() == _opener; }
  [[nodiscard]] bool addCopy(const std::string& path, TLErrorOut error);

  const std::unique_ptr<leveldb::Env> _memory;
  std::map<std::string, Table> _tables;  // by path; fixed once captured
  const std::thread::id _opener = std::this_thread::get_id();
};

}  // namespace salt
