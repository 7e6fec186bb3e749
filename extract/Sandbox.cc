#include "extract/Sandbox.h"

#include <fcntl.h>
#include <linux/landlock.h>
#include <seccomp.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <initializer_list>

#include "platform/FileDescriptor.h"

namespace extract {

namespace {

constexpr const char* kCharacterTables = "/usr/share/poppler";

bool limitTo(__rlimit_resource resource, rlim_t most) {
  const rlimit limit{most, most};
  return setrlimit(resource, &limit) == 0;
}

bool setLimits() {
#ifndef TALLOW_UNLIMITED_MEMORY  // sanitizers reserve terabytes of addresses
  if (!limitTo(RLIMIT_AS, kMaxMemoryBytes)) return false;
#endif
  return limitTo(RLIMIT_CPU, kMaxCPUSeconds) && limitTo(RLIMIT_FSIZE, 0) &&
         limitTo(RLIMIT_CORE, 0) && limitTo(RLIMIT_NOFILE, 16);
}

// Makes all files inaccessible except for reading the tables. False without Landlock.
bool restrictFiles() {
  landlock_ruleset_attr rules{};
  rules.handled_access_fs = (LANDLOCK_ACCESS_FS_MAKE_SYM << 1) - 1;  // all of the first version
  const platform::FileDescriptor ruleset(
      static_cast<int>(syscall(SYS_landlock_create_ruleset, &rules, sizeof rules, 0)));
  if (ruleset.get() < 0) return false;
  const platform::FileDescriptor tables(open(kCharacterTables, O_PATH | O_CLOEXEC));
  landlock_path_beneath_attr below{};
  below.allowed_access = LANDLOCK_ACCESS_FS_READ_FILE;
  below.parent_fd = tables.get();
  if (tables.get() >= 0) {
    syscall(SYS_landlock_add_rule, ruleset.get(), LANDLOCK_RULE_PATH_BENEATH, &below, 0);
  }
  return syscall(SYS_landlock_restrict_self, ruleset.get(), 0) == 0;
}

// A list of system calls that may be made. All others fail with EPERM.
class Filter {
 public:
  ~Filter() { seccomp_release(_context); }

  void allow(std::initializer_list<int> calls) {
    for (const int call : calls) add(call, {});
  }
  void allowIf(int call, std::initializer_list<scmp_arg_cmp> conditions) { add(call, conditions); }
  [[nodiscard]] bool load() { return _good && seccomp_load(_context) == 0; }

 private:
  void add(int call, std::initializer_list<scmp_arg_cmp> conditions) {
    _good = _good && seccomp_rule_add_array(_context, SCMP_ACT_ALLOW, call,
                                            static_cast<unsigned>(conditions.size()),
                                            conditions.begin()) == 0;
  }

  const scmp_filter_ctx _context = seccomp_init(SCMP_ACT_ERRNO(EPERM));
  bool _good = _context != nullptr;
};

scmp_arg_cmp equals(unsigned argument, uint64_t value) {
  return {argument, SCMP_CMP_EQ, value, 0};
}

scmp_arg_cmp hasNone(unsigned argument, uint64_t bits) {
  return {argument, SCMP_CMP_MASKED_EQ, bits, 0};
}

bool restrictCalls(int socket, bool filesRestricted) {
  Filter filter;
  filter.allow({SCMP_SYS(brk), SCMP_SYS(munmap), SCMP_SYS(mremap), SCMP_SYS(madvise)});
  filter.allow({SCMP_SYS(read), SCMP_SYS(pread64), SCMP_SYS(lseek), SCMP_SYS(close),
                SCMP_SYS(fstat), SCMP_SYS(readv)});
  filter.allow({SCMP_SYS(futex), SCMP_SYS(rt_sigprocmask), SCMP_SYS(rt_sigreturn),
                SCMP_SYS(sched_yield), SCMP_SYS(getpid), SCMP_SYS(gettid)});
  filter.allow({SCMP_SYS(clock_gettime), SCMP_SYS(gettimeofday), SCMP_SYS(getrusage),
                SCMP_SYS(getrandom), SCMP_SYS(sysinfo), SCMP_SYS(exit), SCMP_SYS(exit_group)});
#ifdef TALLOW_UNLIMITED_MEMORY
  filter.allow({SCMP_SYS(sigaltstack)});  // sanitizers ask for it where a function does not return
#endif
  filter.allowIf(SCMP_SYS(mmap), {hasNone(2, PROT_EXEC)});
  filter.allowIf(SCMP_SYS(mprotect), {hasNone(2, PROT_EXEC)});
  // The C library's fstat. A path would tell only that a file exists.
  filter.allowIf(SCMP_SYS(newfstatat), {equals(3, AT_EMPTY_PATH)});
  filter.allowIf(SCMP_SYS(tgkill), {equals(0, static_cast<uint64_t>(getpid()))});  // abort
  const auto descriptor = static_cast<uint64_t>(socket);
  filter.allowIf(SCMP_SYS(recvmsg), {equals(0, descriptor)});
  filter.allowIf(SCMP_SYS(sendto), {equals(0, descriptor), equals(4, 0)});
  if (filesRestricted) {
    filter.allowIf(SCMP_SYS(openat),
                   {hasNone(2, O_ACCMODE | O_CREAT | O_TRUNC | O_PATH | O_DIRECTORY)});
  }
  return filter.load();
}

}  // namespace

bool enterSandbox(int socket) {
  if (prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0 || !setLimits()) return false;
  return restrictCalls(socket, restrictFiles());
}

bool shouldRetire() {
  rusage used{};
  getrusage(RUSAGE_SELF, &used);
  return used.ru_utime.tv_sec + used.ru_stime.tv_sec >= static_cast<time_t>(kRetiringCPUSeconds);
}

}  // namespace extract
