// Fault injection, preloaded into a daemon: lets one system call fail, or kills the process just
// before it.
//
//   TALLOW_FAULT="CALL K ACTION"  the K-th call of CALL, counted from 1; ACTION is a decimal errno
//                                 or "kill"
//   TALLOW_FAULT_MARK=FILE        created when the fault happens
//   TALLOW_FAULT_THREADS=N        no thread is started while N are running
//
// Of write and mmap only calls on regular files count, not those for the log, sockets and wake-ups.
#include <dirent.h>
#include <dlfcn.h>
#include <fcntl.h>
#include <pthread.h>
#include <sys/mman.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <csignal>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace {

struct Fault {
  char call[32] = "";
  int at = 0;
  char action[16] = "";
  std::atomic<int> seen{0};
  long mostThreads = 0;

  Fault() {
    if (const char* text = std::getenv("TALLOW_FAULT")) {
      if (std::sscanf(text, "%31s %d %15s", call, &at, action) != 3) std::abort();
    }
    if (const char* text = std::getenv("TALLOW_FAULT_THREADS")) mostThreads = std::atol(text);
  }
};

Fault& fault() {
  static Fault instance;
  return instance;
}

// The errno of the fault if this call must fail, otherwise 0.
int faultAt(const char* call) {
  Fault& f = fault();
  if (f.at == 0 || std::strcmp(f.call, call) != 0 || ++f.seen != f.at) return 0;
  if (const char* mark = std::getenv("TALLOW_FAULT_MARK")) {
    const long file = syscall(SYS_openat, AT_FDCWD, mark, O_CREAT | O_WRONLY, 0600);
    syscall(SYS_close, file);
  }
  if (std::strcmp(f.action, "kill") == 0) kill(getpid(), SIGKILL);
  return std::atoi(f.action);
}

bool isFile(int descriptor) {
  struct stat info;
  return fstat(descriptor, &info) == 0 && S_ISREG(info.st_mode);
}

template <typename Function>
Function* next(const char* name) {
  return reinterpret_cast<Function*>(dlsym(RTLD_NEXT, name));
}

// False, with errno set, if the call must fail.
bool passes(const char* call) {
  const int code = faultAt(call);
  if (code != 0) errno = code;
  return code == 0;
}

long runningThreads() {
  DIR* tasks = opendir("/proc/self/task");
  if (tasks == nullptr) return 0;
  long count = -2;  // . and ..
  while (readdir(tasks) != nullptr) ++count;
  closedir(tasks);
  return count;
}

mode_t modeOf(int flags, va_list arguments) {
  return (flags & O_CREAT) != 0 ? va_arg(arguments, mode_t) : 0;
}

}  // namespace

#define TALLOW_OPEN(name, parameters, directory)                               \
  extern "C" int name parameters {                                             \
    static auto* const real = next<int(int, const char*, int, ...)>("openat"); \
    va_list arguments;                                                         \
    va_start(arguments, flags);                                                \
    const mode_t mode = modeOf(flags, arguments);                              \
    va_end(arguments);                                                         \
    return passes("openat") ? real(directory, path, flags, mode) : -1;         \
  }
TALLOW_OPEN(open, (const char* path, int flags, ...), AT_FDCWD)
TALLOW_OPEN(open64, (const char* path, int flags, ...), AT_FDCWD)
TALLOW_OPEN(openat, (int directory, const char* path, int flags, ...), directory)
TALLOW_OPEN(openat64, (int directory, const char* path, int flags, ...), directory)

#define TALLOW_SIMPLE(result, name, call, parameters, arguments, failure) \
  extern "C" result name parameters {                                     \
    static auto* const real = next<result parameters>(#name);             \
    return passes(call) ? real arguments : failure;                       \
  }
TALLOW_SIMPLE(ssize_t, pwrite, "pwrite64", (int fd, const void* bytes, size_t size, off_t at),
              (fd, bytes, size, at), -1)
TALLOW_SIMPLE(ssize_t, pwrite64, "pwrite64", (int fd, const void* bytes, size_t size, off64_t at),
              (fd, bytes, size, at), -1)
TALLOW_SIMPLE(int, fdatasync, "fdatasync", (int fd), (fd), -1)
TALLOW_SIMPLE(int, fsync, "fsync", (int fd), (fd), -1)
TALLOW_SIMPLE(int, rename, "rename", (const char* from, const char* to), (from, to), -1)
TALLOW_SIMPLE(int, unlink, "unlink", (const char* path), (path), -1)
TALLOW_SIMPLE(int, ftruncate, "ftruncate", (int fd, off_t size), (fd, size), -1)
TALLOW_SIMPLE(int, ftruncate64, "ftruncate", (int fd, off64_t size), (fd, size), -1)
TALLOW_SIMPLE(int, accept4, "accept4", (int fd, sockaddr* address, socklen_t* size, int flags),
              (fd, address, size, flags), -1)

TALLOW_SIMPLE(ssize_t, write, isFile(fd) ? "write" : "", (int fd, const void* bytes, size_t size),
              (fd, bytes, size), -1)
TALLOW_SIMPLE(void*, mmap, fd >= 0 ? "mmap" : "",
              (void* address, size_t size, int protection, int flags, int fd, off_t at),
              (address, size, protection, flags, fd, at), MAP_FAILED)
TALLOW_SIMPLE(void*, mmap64, fd >= 0 ? "mmap" : "",
              (void* address, size_t size, int protection, int flags, int fd, off64_t at),
              (address, size, protection, flags, fd, at), MAP_FAILED)

extern "C" int pthread_create(pthread_t* thread, const pthread_attr_t* attributes,
                              void* (*body)(void*), void* argument) {
  static auto* const real =
      next<int(pthread_t*, const pthread_attr_t*, void* (*)(void*), void*)>("pthread_create");
  if (fault().mostThreads != 0 && runningThreads() >= fault().mostThreads) return EAGAIN;
  const int code = faultAt("clone3");
  return code != 0 ? code : real(thread, attributes, body, argument);
}
