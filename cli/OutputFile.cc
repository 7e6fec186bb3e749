#include "cli/OutputFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>

#include "platform/FileDescriptor.h"

namespace cli {

namespace {

bool writeAll(int file, std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t count = write(file, bytes.data(), bytes.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return false;
    bytes.remove_prefix(static_cast<size_t>(count));
  }
  return true;
}

}  // namespace

bool writeNewFile(const std::string& path, std::string_view bytes) {
  constexpr int kNew = O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC;
  const platform::FileDescriptor file(open(path.c_str(), kNew, 0600));
  if (file.get() < 0) return false;
  if (writeAll(file.get(), bytes)) return true;
  const int failure = errno;
  unlink(path.c_str());
  errno = failure;
  return false;
}

bool replaceFile(const std::string& path, std::string_view bytes) {
  struct stat info;
  if (lstat(path.c_str(), &info) == 0 && !S_ISREG(info.st_mode)) {
    errno = S_ISDIR(info.st_mode) ? EISDIR : EEXIST;
    return false;
  }
  std::string temporary = path + ".XXXXXX";
  const platform::FileDescriptor file(mkostemp(temporary.data(), O_CLOEXEC));
  if (file.get() < 0) return false;
  if (writeAll(file.get(), bytes) && rename(temporary.c_str(), path.c_str()) == 0) return true;
  const int failure = errno;
  unlink(temporary.c_str());
  errno = failure;
  return false;
}

}  // namespace cli
