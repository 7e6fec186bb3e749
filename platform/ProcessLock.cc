#include "platform/ProcessLock.h"

#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

#include <cerrno>

#include "platform/Files.h"

namespace platform {

std::unique_ptr<ProcessLock> ProcessLock::acquire(const std::string& path, TLErrorOut error) {
  if (!createDirectories(path.substr(0, path.rfind('/')), error)) return nullptr;
  const int descriptor = open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600);
  if (descriptor < 0) {
    setError(error, posixError(errno, path));
    return nullptr;
  }
  if (flock(descriptor, LOCK_EX | LOCK_NB) != 0) {
    setError(error, errno == EWOULDBLOCK ? TLError{kPOSIXErrorDomain, EWOULDBLOCK,
                                                   path + " is held by a running daemon"}
                                         : posixError(errno, path));
    close(descriptor);
    return nullptr;
  }
  return std::unique_ptr<ProcessLock>(new ProcessLock(descriptor));
}

ProcessLock::~ProcessLock() {
  close(_descriptor);
}

}  // namespace platform
