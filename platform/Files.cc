#include "platform/Files.h"

#include <fcntl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <fstream>

#include "platform/FileDescriptor.h"
#include "platform/Paths.h"

namespace platform {

namespace fs = std::filesystem;

namespace {

constexpr const char* kProtectionAttribute = "user.tallow.protection";
constexpr mode_t kPrivateMode = 0700;

bool refuseNUL(const std::string& path, TLErrorOut error) {
  if (path.find('\0') == std::string::npos) return false;
  setError(error, posixError(EINVAL, "path holds a NUL"));
  return true;
}

bool makeDirectory(const std::string& path, TLErrorOut error) {
  if (mkdir(path.c_str(), kPrivateMode) == 0) return true;
  const int code = errno;
  struct stat info;
  if (code == EEXIST && stat(path.c_str(), &info) == 0 && S_ISDIR(info.st_mode)) return true;
  setError(error, posixError(code, path));
  return false;
}

}  // namespace

bool readAt(int file, uint64_t offset, char* bytes, size_t count) {
  while (count > 0) {
    const ssize_t n = pread(file, bytes, count, static_cast<off_t>(offset));
    if (n < 0 && errno == EINTR) continue;
    if (n == 0) errno = 0;
    if (n <= 0) return false;
    bytes += n;
    offset += static_cast<uint64_t>(n);
    count -= static_cast<size_t>(n);
  }
  return true;
}

bool writeAt(int file, uint64_t offset, std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t n = pwrite(file, bytes.data(), bytes.size(), static_cast<off_t>(offset));
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return false;
    offset += static_cast<uint64_t>(n);
    bytes.remove_prefix(static_cast<size_t>(n));
  }
  return true;
}

bool fileExists(const std::string& path) {
  return path.find('\0') == std::string::npos && access(path.c_str(), F_OK) == 0;
}

bool createDirectories(const std::string& path, TLErrorOut error,
                       const std::optional<std::string>& protectionClass) {
  if (refuseNUL(path, error)) return false;
  for (size_t slash = path.find('/', 1); slash != std::string::npos;
       slash = path.find('/', slash + 1)) {
    const std::string parent = path.substr(0, slash);
    if (!fileExists(parent) && !makeDirectory(parent, error)) return false;
  }
  if (!makeDirectory(path, error)) return false;
  if (protectionClass) {
    setxattr(path.c_str(), kProtectionAttribute, protectionClass->data(), protectionClass->size(),
             0);
  }
  return true;
}

std::optional<std::vector<std::string>> listDirectory(const std::string& path, TLErrorOut error) {
  if (refuseNUL(path, error)) return std::nullopt;
  std::error_code code;
  std::vector<std::string> names;
  fs::directory_iterator it(path, code);
  for (; !code && it != fs::directory_iterator(); it.increment(code)) {
    names.push_back(it->path().filename().string());
  }
  if (code) {
    setError(error, posixError(code.value(), path));
    return std::nullopt;
  }
  return names;
}

bool removeItem(const std::string& path, TLErrorOut error) {
  if (refuseNUL(path, error)) return false;
  std::error_code code;
  fs::remove_all(path, code);
  if (code) {
    setError(error, posixError(code.value(), path));
    return false;
  }
  return true;
}

std::optional<std::string> readFile(const std::string& path, size_t maximum, TLErrorOut error) {
  if (refuseNUL(path, error)) return std::nullopt;
  const FileDescriptor file(open(path.c_str(), O_RDONLY | O_CLOEXEC));
  if (file.get() < 0) {
    setError(error, posixError(errno, path));
    return std::nullopt;
  }
  std::string bytes;
  char buffer[65536];
  for (;;) {
    const ssize_t n = ::read(file.get(), buffer, sizeof buffer);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) {
      setError(error, posixError(errno, path));
      return std::nullopt;
    }
    if (n == 0) return bytes;
    if (bytes.size() + static_cast<size_t>(n) > maximum) {
      setError(error, posixError(EFBIG, path));
      return std::nullopt;
    }
    bytes.append(buffer, static_cast<size_t>(n));
  }
}

bool writeFileAtomically(const std::string& path, const std::string& bytes, TLErrorOut error) {
  return writeFileAtomically(
      path, [&bytes](int file) { return writeAt(file, 0, bytes); }, error);
}

bool writeFileAtomically(const std::string& path, const std::function<bool(int file)>& write,
                         TLErrorOut error) {
  if (refuseNUL(path, error)) return false;
  const std::string temporary = path + ".new";
  {
    const FileDescriptor file(
        open(temporary.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600));
    if (file.get() < 0 || !write(file.get()) || fsync(file.get()) != 0) {
      setError(error, posixError(errno, temporary));
      return false;
    }
  }
  if (rename(temporary.c_str(), path.c_str()) != 0) {
    setError(error, posixError(errno, path));
    return false;
  }
  return true;
}

FileDescriptor openUnnamedFile(const std::string& directory) {
  FileDescriptor file(open(directory.c_str(), O_TMPFILE | O_RDWR | O_CLOEXEC, 0600));
  if (file.get() >= 0 || (errno != EOPNOTSUPP && errno != EISDIR)) return file;
  // The file system has only files with names.
  std::string path = joinPath(directory, "unnamed-XXXXXX");
  file = FileDescriptor(mkostemp(path.data(), O_CLOEXEC));
  if (file.get() >= 0) unlink(path.c_str());
  return file;
}

uint64_t freeBytes(const std::string& path) {
  std::error_code error;
  const auto space = fs::space(path, error);
  return error ? UINT64_MAX : space.available;
}

void raiseDescriptorLimit() {
  rlimit limit;
  if (getrlimit(RLIMIT_NOFILE, &limit) != 0) return;
  limit.rlim_cur = limit.rlim_max;
  setrlimit(RLIMIT_NOFILE, &limit);
}

namespace {

size_t descriptorLimit() {
  rlimit limit;
  return getrlimit(RLIMIT_NOFILE, &limit) == 0 ? limit.rlim_cur : 0;
}

}  // namespace

size_t freeDescriptors() {
  std::error_code failure;
  std::filesystem::directory_iterator open("/proc/self/fd", failure);
  if (failure) return 0;
  const auto count = static_cast<size_t>(std::distance(begin(open), end(open)));
  return descriptorLimit() - std::min(count, descriptorLimit());
}

size_t descriptorReserve() {
  constexpr size_t kMaxReserve = 256;
  return std::min(descriptorLimit() / 4, kMaxReserve);
}

}  // namespace platform
