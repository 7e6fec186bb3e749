#include "tests/desktop/Process.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/inotify.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <cstdlib>

#include "platform/Assert.h"
#include "platform/FileDescriptor.h"
#include "platform/Files.h"

namespace testsupport {

namespace {

constexpr size_t kMaxFileBytes = size_t{16} << 20;

int listenAt(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  path.copy(address.sun_path, sizeof address.sun_path - 1);
  unlink(path.c_str());
  const int descriptor = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
  TL_ASSERT(bind(descriptor, reinterpret_cast<sockaddr*>(&address), sizeof address) == 0);
  return descriptor;
}

}  // namespace

Process::Process(const std::vector<std::string>& arguments, const Variables& environment,
                 std::string log)
    : _log(std::move(log)), _notifyPath(_log + ".notify"), _notify(listenAt(_notifyPath)) {
  std::array<int, 2> output;
  TL_ASSERT(pipe2(output.data(), O_CLOEXEC) == 0);
  _output = output[0];
  _pid = fork();
  TL_ASSERT(_pid >= 0);
  if (_pid == 0) run(arguments, environment, output[1]);
  close(output[1]);
  _ended = static_cast<int>(syscall(SYS_pidfd_open, _pid, 0));
}

void Process::run(const std::vector<std::string>& arguments, const Variables& environment,
                  int output) {
  prctl(PR_SET_PDEATHSIG, SIGKILL);
  setenv("NOTIFY_SOCKET", _notifyPath.c_str(), 1);
  for (const auto& [name, value] : environment) setenv(name.c_str(), value.c_str(), 1);
  dup2(output, STDOUT_FILENO);
  dup2(open(_log.c_str(), O_CREAT | O_WRONLY | O_APPEND | O_CLOEXEC, 0600), STDERR_FILENO);
  std::vector<char*> words;
  for (const std::string& argument : arguments)
    words.push_back(const_cast<char*>(argument.c_str()));
  words.push_back(nullptr);
  execvp(words[0], words.data());
  _exit(127);
}

Process::~Process() {
  if (_pid > 0) end(SIGKILL);
  for (const int descriptor : {_notify, _output, _ended}) close(descriptor);
}

bool Process::awaitReady() {
  std::array<pollfd, 2> descriptors{{{_notify, POLLIN, 0}, {_ended, POLLIN, 0}}};
  poll(descriptors.data(), descriptors.size(), -1);
  std::array<char, 256> message{};
  return (descriptors[0].revents & POLLIN) != 0 &&
         recv(_notify, message.data(), message.size() - 1, 0) > 0 &&
         std::string(message.data()).starts_with("READY=1");
}

std::string Process::readLine() const {
  std::string line;
  char c = 0;
  while (read(_output, &c, 1) == 1 && c != '\n') line.push_back(c);
  return line;
}

int Process::end(int signal) {
  if (signal != 0) kill(_pid, signal);
  int status = 0;
  waitpid(_pid, &status, 0);
  _pid = -1;
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

std::string Process::log() const {
  return platform::readFile(_log, kMaxFileBytes, nullptr).value_or("");
}

void awaitFile(const std::string& directory, const std::string& name, const std::string& content) {
  const platform::FileDescriptor changes(inotify_init1(IN_CLOEXEC));
  TL_ASSERT(inotify_add_watch(changes.get(), directory.c_str(), IN_MOVED_TO | IN_CLOSE_WRITE) >= 0);
  std::array<char, 4096> events;
  while (platform::readFile(directory + '/' + name, kMaxFileBytes, nullptr) != content) {
    TL_ASSERT(read(changes.get(), events.data(), events.size()) > 0);
  }
}

bool hasPrograms(const std::vector<std::string>& names) {
  for (const std::string& name : names) {
    if (std::system(("command -v " + name + " >/dev/null").c_str()) == 0) continue;
    const char* const ci = std::getenv("CI");
    if (ci != nullptr && std::string(ci) == "true") ADD_FAILURE() << name << " is not installed";
    return false;
  }
  return true;
}

}  // namespace testsupport
