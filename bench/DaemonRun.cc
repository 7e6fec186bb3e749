#include "bench/DaemonRun.h"

#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <string_view>
#include <system_error>
#include <utility>
#include <vector>

#include "bench/ChildProcess.h"

namespace bench {

namespace {

constexpr int kReadyMilliseconds = 30000;

[[noreturn]] void fail(const std::string& what) {
  throw std::runtime_error(what);
}

[[noreturn]] void failWithErrno(const std::string& what) {
  throw std::system_error(errno, std::generic_category(), what);
}

class Descriptor {
 public:
  Descriptor(int descriptor, const char* what) : _descriptor(descriptor) {
    if (descriptor < 0) failWithErrno(what);
  }
  ~Descriptor() { close(_descriptor); }
  Descriptor(const Descriptor&) = delete;
  Descriptor& operator=(const Descriptor&) = delete;
  [[nodiscard]] int get() const { return _descriptor; }

 private:
  const int _descriptor;
};

// Binds the socket on which the daemon reports that it is ready.
void bindTo(const Descriptor& socket, const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (path.size() >= sizeof address.sun_path) fail(path + ": too long for a socket");
  path.copy(address.sun_path, path.size());
  if (bind(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    failWithErrno(path);
  }
}

double secondsOf(clockid_t clock) {
  timespec time{};
  if (clock_gettime(clock, &time) != 0) failWithErrno("clock_gettime");
  return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) / 1e9;
}

}  // namespace

ScratchDirectory::ScratchDirectory() {
  std::string pattern = std::filesystem::temp_directory_path().string() + "/tallow-bench-XXXXXX";
  if (mkdtemp(pattern.data()) == nullptr) failWithErrno(pattern);
  _path = pattern;
}

ScratchDirectory::~ScratchDirectory() {
  std::error_code ignored;
  std::filesystem::remove_all(_path, ignored);
}

DaemonRun::DaemonRun(const ScratchDirectory& scratch, const std::string& stateDirectory)
    : _runtimeDirectory(scratch / "run") {
  std::filesystem::create_directories(_runtimeDirectory);
  std::filesystem::create_directories(stateDirectory);
  const Descriptor ready(socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0), "socket");
  const std::string readyPath = scratch / "notify";
  bindTo(ready, readyPath);
  spawn(std::filesystem::absolute(stateDirectory), readyPath, scratch / "daemon.log");
  try {
    awaitReady(ready.get());
  } catch (...) {
    end(SIGKILL);
    throw;
  }
  _watch.emplace(_pid);
}

DaemonRun::~DaemonRun() {
  if (_watch) _watch->stop();
  if (_pid >= 0) end(SIGKILL);
}

void DaemonRun::spawn(const std::string& stateDirectory, const std::string& notifyPath,
                      const std::string& logPath) {
  const std::string program = programBeside("tallowsearchd");
  std::vector<std::string> variables = environmentWith({{"STATE_DIRECTORY", stateDirectory},
                                                        {"RUNTIME_DIRECTORY", _runtimeDirectory},
                                                        {"NOTIFY_SOCKET", notifyPath}});
  std::vector<char*> environment;
  for (std::string& variable : variables) environment.push_back(variable.data());
  environment.push_back(nullptr);
  const Descriptor log(open(logPath.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600), "daemon.log");
  const pid_t parent = getpid();
  _pid = fork();
  if (_pid < 0) failWithErrno("fork");
  if (_pid > 0) return;
  // In the child only async-signal-safe calls are allowed.
  prctl(PR_SET_PDEATHSIG, SIGKILL);
  if (getppid() != parent) _exit(127);
  dup2(log.get(), STDERR_FILENO);
  char* const arguments[] = {const_cast<char*>("tallowsearchd"), nullptr};
  execve(program.c_str(), arguments, environment.data());
  _exit(127);
}

void DaemonRun::awaitReady(int notifySocket) const {
  const Descriptor process(static_cast<int>(syscall(SYS_pidfd_open, _pid, 0)), "pidfd_open");
  for (;;) {
    std::array<pollfd, 2> events{{{notifySocket, POLLIN, 0}, {process.get(), POLLIN, 0}}};
    const int count = poll(events.data(), events.size(), kReadyMilliseconds);
    if (count < 0 && errno != EINTR) failWithErrno("poll");
    if (count == 0) fail("tallowsearchd did not get ready");
    if ((events[0].revents & POLLIN) != 0) {
      char message[4096];
      const ssize_t size = recv(notifySocket, message, sizeof message, 0);
      if (size < 0) failWithErrno("recv");
      const std::string_view text(message, static_cast<size_t>(size));
      if (text.find("READY=1") != std::string_view::npos) return;
    } else if (events[1].revents != 0) {
      fail("tallowsearchd ended before it was ready; it must lie beside this program");
    }
  }
}

double DaemonRun::cpuSeconds() const {
  return cpuSecondsOf(_pid);
}

std::optional<pid_t> DaemonRun::threadNamed(const std::string& name) const {
  const std::string tasks = "/proc/" + std::to_string(_pid) + "/task";
  for (const auto& task : std::filesystem::directory_iterator(tasks)) {
    std::ifstream file(task.path() / "comm");  // the thread may have ended
    std::string found;
    if (std::getline(file, found) && found == name) return std::stoi(task.path().filename());
  }
  return std::nullopt;
}

size_t DaemonRun::countEntries(const char* directory) const {
  const auto path = std::filesystem::path("/proc") / std::to_string(_pid) / directory;
  return static_cast<size_t>(std::distance(std::filesystem::directory_iterator(path), {}));
}

int DaemonRun::end(int signal) {
  const pid_t pid = std::exchange(_pid, -1);
  int status = 0;
  kill(pid, signal);
  while (waitpid(pid, &status, 0) < 0 && errno == EINTR) {
  }
  return status;
}

void DaemonRun::stop() {
  _watch->stop();
  const int status = end(SIGTERM);
  if (!WIFEXITED(status) || WEXITSTATUS(status) != 0) fail("tallowsearchd did not end well");
}

uint64_t bytesOnDisk(const std::string& path) {
  uint64_t bytes = 0;
  for (const auto& entry : std::filesystem::recursive_directory_iterator(path)) {
    struct stat status;
    constexpr uint64_t kBlock = 512;
    if (lstat(entry.path().c_str(), &status) == 0) bytes += status.st_blocks * kBlock;
  }
  return bytes;
}

double secondsNow() {
  return secondsOf(CLOCK_MONOTONIC);
}

double cpuSecondsOf(pid_t process) {
  clockid_t clock;
  if (const int code = clock_getcpuclockid(process, &clock); code != 0) {
    throw std::system_error(code, std::generic_category(), "clock_getcpuclockid");
  }
  return secondsOf(clock);
}

double cpuSecondsNow() {
  return secondsOf(CLOCK_PROCESS_CPUTIME_ID);
}

int guarded(const char* program, int (*run)(int, char**), int argc, char** argv) {
  try {
    return run(argc, argv);
  } catch (const std::exception& error) {
    std::fprintf(stderr, "%s: %s\n", program, error.what());
    return 1;
  }
}

}  // namespace bench
