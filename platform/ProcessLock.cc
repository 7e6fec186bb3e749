#include "platform/ProcessLock.h"

#include <fcntl.h>
#include <sys/file.h>

#include <cerrno>

#include "platform/Files.h"

namespace platform {

std::unique_ptr<ProcessLock> ProcessLock::acquire(const std::string& path, TLErrorOut error) {
  if (!createDirectories(path.substr(0, path.rfind('/')), error)) return nullptr;
  return lock(FileDescriptor(open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600)), LOCK_EX, path,
              error);
}

std::unique_ptr<ProcessLock> ProcessLock::acquireShared(const std::string& path, TLErrorOut error) {
  return lock(FileDescriptor(open(path.c_str(), O_RDONLY | O_CLOEXEC)), LOCK_SH, path, error);
}

std::unique_ptr<ProcessLock> ProcessLock::lock(FileDescriptor file, int operation,
                                               const std::string& path, TLErrorOut error) {
  if (file.get() < 0) {
    setError(error, posixError(errno, path));
    return nullptr;
  }
  if (flock(file.get(), operation | LOCK_NB) != 0) {
    setError(error, errno == EWOULDBLOCK ? TLError{kPOSIXErrorDomain, EWOULDBLOCK,
                                                   path + " is held by a running daemon"}
                                         : posixError(errno, path));
    return nullptr;
  }
  return std::unique_ptr<ProcessLock>(new ProcessLock(std::move(file)));
}

}  // namespace platform
