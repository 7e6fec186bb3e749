#pragma once

#include <memory>
#include <string>

#include "platform/FileDescriptor.h"
#include "platform/TLError.h"

namespace platform {

// An inter-process lock on a file. It is released with the object or the process; the file stays.
class ProcessLock {
 public:
  // Acquires it exclusively. Null with an error when another process holds the lock or the file
  // cannot be created.
  [[nodiscard]] static std::unique_ptr<ProcessLock> acquire(const std::string& path,
                                                            TLErrorOut error);

  // Acquires it shared: excludes exclusive holders only, and never creates or changes the file.
  // Null with an error when the lock is held exclusively (EWOULDBLOCK) or the file cannot be read.
  [[nodiscard]] static std::unique_ptr<ProcessLock> acquireShared(const std::string& path,
                                                                  TLErrorOut error);

 private:
  explicit ProcessLock(FileDescriptor file) : _file(std::move(file)) {}
  static std::unique_ptr<ProcessLock> lock(FileDescriptor file, int operation,
                                           const std::string& path, TLErrorOut error);

  const FileDescriptor _file;
};

}  // namespace platform
