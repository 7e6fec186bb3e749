#pragma once

#include <leveldb/env.h>

#include <memory>
#include <string>

// Fault injection between leveldb and its files.
namespace salttest {

// Forwards everything.
class FaultInjectionFile : public leveldb::WritableFile {
 public:
  explicit FaultInjectionFile(leveldb::WritableFile* file) : _file(file) {}

  leveldb::Status Append(const leveldb::Slice& bytes) override { return _file->Append(bytes); }
  leveldb::Status Flush() override { return _file->Flush(); }
  leveldb::Status Sync() override { return _file->Sync(); }
  leveldb::Status Close() override { return _file->Close(); }

 private:
  const std::unique_ptr<leveldb::WritableFile> _file;
};

// Forwards to the real files, but lets a test wrap every file that is opened for writing.
class FaultInjectionEnv : public leveldb::EnvWrapper {
 public:
  FaultInjectionEnv() : leveldb::EnvWrapper(leveldb::Env::Default()) {}

  leveldb::Status NewWritableFile(const std::string& path, leveldb::WritableFile** file) override {
    return wrapIfOpened(path, target()->NewWritableFile(path, file), file);
  }
  leveldb::Status NewAppendableFile(const std::string& path,
                                    leveldb::WritableFile** file) override {
    return wrapIfOpened(path, target()->NewAppendableFile(path, file), file);
  }

 protected:
  // The wrapper of a file that was opened for writing; takes ownership.
  virtual leveldb::WritableFile* wrap(const std::string& path, leveldb::WritableFile* file) = 0;

 private:
  leveldb::Status wrapIfOpened(const std::string& path, const leveldb::Status& status,
                               leveldb::WritableFile** file) {
    if (status.ok()) *file = wrap(path, *file);
    return status;
  }
};

}  // namespace salttest
