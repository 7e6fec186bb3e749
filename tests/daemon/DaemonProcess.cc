#include "tests/daemon/DaemonProcess.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/inotify.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <cstdlib>

#include "platform/Assert.h"
#include "platform/Files.h"

namespace testsupport {

namespace {

constexpr size_t kMaxLogBytes = size_t{256} << 20;
constexpr int kFirstPassedSocket = 3;

int listenForNotification(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  path.copy(address.sun_path, sizeof address.sun_path - 1);
  unlink(path.c_str());
  const int descriptor = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
  TL_ASSERT(bind(descriptor, reinterpret_cast<sockaddr*>(&address), sizeof address) == 0);
  return descriptor;
}

}  // namespace

DaemonProcess::DaemonProcess(const std::string& directory, const std::vector<int>& passedSockets,
                             const std::string& socketNames)
    : _directory(directory), _runtimeDirectory(directory + "/run") {
  TL_ASSERT(platform::createDirectories(_runtimeDirectory, nullptr));
  const std::string notifyPath = _directory + "/notify";
  const int notify = listenForNotification(notifyPath);
  const int log =
      open((_directory + "/log").c_str(), O_CREAT | O_WRONLY | O_APPEND | O_CLOEXEC, 0600);
  _pid = fork();
  TL_ASSERT(_pid >= 0);
  if (_pid == 0) {
    setenv("STATE_DIRECTORY", (_directory + "/state").c_str(), 1);
    setenv("RUNTIME_DIRECTORY", _runtimeDirectory.c_str(), 1);
    setenv("NOTIFY_SOCKET", notifyPath.c_str(), 1);
    dup2(log, 2);
    if (!passedSockets.empty()) {
      setenv("LISTEN_PID", std::to_string(getpid()).c_str(), 1);
      setenv("LISTEN_FDS", std::to_string(passedSockets.size()).c_str(), 1);
      setenv("LISTEN_FDNAMES", socketNames.c_str(), 1);
      for (size_t i = 0; i < passedSockets.size(); ++i) {
        dup2(passedSockets[i], kFirstPassedSocket + static_cast<int>(i));
      }
    }
    execl(TALLOW_DAEMON_PROGRAM, TALLOW_DAEMON_PROGRAM, nullptr);
    _exit(127);
  }
  close(log);
  _ended = static_cast<int>(syscall(SYS_pidfd_open, _pid, 0));
  TL_ASSERT(_ended >= 0);
  _ready = waitUntilReady(notify);
  close(notify);
}

DaemonProcess::~DaemonProcess() {
  if (_pid > 0) {
    kill(_pid, SIGKILL);
    wait();
  }
  close(_ended);
}

bool DaemonProcess::waitUntilReady(int notifySocket) {
  for (;;) {
    std::array<pollfd, 2> descriptors{{{notifySocket, POLLIN, 0}, {_ended, POLLIN, 0}}};
    if (poll(descriptors.data(), descriptors.size(), -1) < 0) continue;
    if ((descriptors[0].revents & POLLIN) == 0) return false;
    std::array<char, 256> message;
    const ssize_t size = recv(notifySocket, message.data(), message.size(), 0);
    if (size > 0 && std::string(message.data(), static_cast<size_t>(size)).find("READY=1") == 0)
      return true;
  }
}

void DaemonProcess::signal(int number) const {
  kill(_pid, number);
}

int DaemonProcess::wait() {
  int status = 0;
  waitpid(_pid, &status, 0);
  _pid = -1;
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

std::string DaemonProcess::log() const {
  return platform::readFile(_directory + "/log", kMaxLogBytes, nullptr).value_or("");
}

bool DaemonProcess::waitForLog(const std::string& text) const {
  const int changes = inotify_init1(IN_CLOEXEC);
  inotify_add_watch(changes, (_directory + "/log").c_str(), IN_MODIFY);
  bool found = log().find(text) != std::string::npos;
  while (!found) {
    std::array<pollfd, 2> descriptors{{{changes, POLLIN, 0}, {_ended, POLLIN, 0}}};
    poll(descriptors.data(), descriptors.size(), -1);
    found = log().find(text) != std::string::npos;
    if (descriptors[1].revents != 0) break;
    std::array<char, 4096> events;
    [[maybe_unused]] const ssize_t n = read(changes, events.data(), events.size());
  }
  close(changes);
  return found;
}

}  // namespace testsupport
