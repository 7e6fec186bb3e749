#pragma once

#include <unistd.h>

#include <utility>

namespace platform {

// Owns a file descriptor, or none if negative.
class FileDescriptor {
 public:
  explicit FileDescriptor(int descriptor = -1) : _descriptor(descriptor) {}
  FileDescriptor(FileDescriptor&& other) noexcept
      : _descriptor(std::exchange(other._descriptor, -1)) {}
  FileDescriptor& operator=(FileDescriptor&& other) noexcept {
    std::swap(_descriptor, other._descriptor);
    return *this;
  }
  ~FileDescriptor() { reset(); }

  [[nodiscard]] int get() const { return _descriptor; }
  [[nodiscard]] int release() { return std::exchange(_descriptor, -1); }
  void reset() {
    if (_descriptor >= 0) ::close(std::exchange(_descriptor, -1));
  }

 private:
  int _descriptor;
};

}  // namespace platform
