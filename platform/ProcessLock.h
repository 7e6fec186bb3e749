#pragma once

#include <memory>
#include <string>

#include "platform/FileDescriptor.h"
#include "platform/TLError.h"

namespace platform {

// Lets one process at a time use something that a file stands for. The lock ends with the object or
// the process; the file stays.
class ProcessLock {
 public:
  // Null with an error when another process holds the lock, or the file cannot be made.
  [[nodiscard]] static std::unique_ptr<ProcessLock> acquire(const std::string& path,
                                                            TLErrorOut error);

  // Keeps the holder of an exclusive lock out, but not others like itself, and never makes or
  // changes the file. Null with an error when the lock is held exclusively (EWOULDBLOCK) or the
  // file cannot be read.
  [[nodiscard]] static std::unique_ptr<ProcessLock> acquireShared(const std::string& path,
                                                                  TLErrorOut error);

 private:
  explicit ProcessLock(FileDescriptor file) : _file(std::move(file)) {}
  static std::unique_ptr<ProcessLock> lock(FileDescriptor file, int operation,
                                           const std::string& path, TLErrorOut error);

  const FileDescriptor _file;
};

}  // namespace platform
