#pragma once

#include <leveldb/env.h>

#include <memory>
#include <string>
#include <utility>

// Fault injection between leveldb and its files.
namespace salttest {

// Forwards to the real files, but lets a test step in when a file opened for writing changes.
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
  using File = leveldb::WritableFile;

  virtual void opened(const std::string&) {}
  virtual leveldb::Status append(const std::string&, File& file, const leveldb::Slice& bytes) {
    return file.Append(bytes);
  }
  virtual leveldb::Status flush(const std::string&, File& file) { return file.Flush(); }
  virtual leveldb::Status sync(const std::string&, File& file) { return file.Sync(); }

 private:
  struct Wrapper final : File {
    Wrapper(FaultInjectionEnv& owner, std::string where, File* real)
        : env(owner), path(std::move(where)), file(real) {}

    leveldb::Status Append(const leveldb::Slice& bytes) override {
      return env.append(path, *file, bytes);
    }
    leveldb::Status Flush() override { return env.flush(path, *file); }
    leveldb::Status Sync() override { return env.sync(path, *file); }
    leveldb::Status Close() override { return file->Close(); }

    FaultInjectionEnv& env;
    const std::string path;
    const std::unique_ptr<File> file;
  };

  leveldb::Status wrapIfOpened(const std::string& path, const leveldb::Status& status,
                               File** file) {
    if (!status.ok()) return status;
    opened(path);
    *file = new Wrapper(*this, path, *file);
    return status;
  }
};

}  // namespace salttest
