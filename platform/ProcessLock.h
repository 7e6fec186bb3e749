#pragma once

#include <memory>
#include <string>

#include "platform/TLError.h"

namespace platform {

// Lets one process at a time use something that a file stands for. The lock ends with the object or
// the process; the file stays.
class ProcessLock {
 public:
  // Null with an error when another process holds the lock, or the file cannot be made.
  [[nodiscard]] static std::unique_ptr<ProcessLock> acquire(const std::string& path,
                                                            TLErrorOut error);
  ~ProcessLock();
  ProcessLock(const ProcessLock&) = delete;
  ProcessLock& operator=(const ProcessLock&) = delete;

 private:
  explicit ProcessLock(int descriptor) : _descriptor(descriptor) {}

  const int _descriptor;
};

}  // namespace platform
