#pragma once

#include <leveldb/env.h>

#include <memory>
#include <string>

// For tests that come between leveldb and its files.
namespace salttest {

// Hands everything on.
class FileBetween : public leveldb::WritableFile {
 public:
  explicit FileBetween(leveldb::WritableFile* file) : _file(file) {}

  leveldb::Status Append(const leveldb::Slice& bytes) override { return _file->Append(bytes); }
  leveldb::Status Flush() override { return _file->Flush(); }
  leveldb::Status Sync() override { return _file->Sync(); }
  leveldb::Status Close() override { return _file->Close(); }

 private:
  const std::unique_ptr<leveldb::WritableFile> _file;
};

// The real files, of which those that are written are seen first.
class FilesBetween : public leveldb::EnvWrapper {
 public:
  FilesBetween() : leveldb::EnvWrapper(leveldb::Env::Default()) {}

  leveldb::Status NewWritableFile(const std::string& path, leveldb::WritableFile** file) override {
    return seen(path, target()->NewWritableFile(path, file), file);
  }
  leveldb::Status NewAppendableFile(const std::string& path,
                                    leveldb::WritableFile** file) override {
    return seen(path, target()->NewAppendableFile(path, file), file);
  }

 protected:
  // What leveldb gets for a file that was opened; takes it.
  virtual leveldb::WritableFile* between(const std::string& path, leveldb::WritableFile* file) = 0;

 private:
  leveldb::Status seen(const std::string& path, const leveldb::Status& status,
                       leveldb::WritableFile** file) {
    if (status.ok()) *file = between(path, *file);
    return status;
  }
};

}  // namespace salttest
