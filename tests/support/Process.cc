#include "tests/support/Process.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/inotify.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <cstdlib>
#include <fstream>
#include <utility>

#include "platform/Assert.h"
#include "platform/FileDescriptor.h"
#include "platform/Files.h"
#include "tests/support/RawMessages.h"

namespace testsupport {

namespace {

constexpr size_t kMaxFileBytes = size_t{256} << 20;
constexpr int kFirstPassedSocket = 3;

int notifySocketAt(const std::string& path) {
  const sockaddr_un address = addressOf(path);
  unlink(path.c_str());
  const int descriptor = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
  TL_ASSERT(bind(descriptor, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0);
  return descriptor;
}

}  // namespace

Process::Process(const std::vector<std::string>& arguments, Variables environment, std::string log,
                 const std::vector<int>& passedSockets)
    : _log(std::move(log)), _notifyPath(_log + ".notify"), _notify(notifySocketAt(_notifyPath)) {
  environment.emplace("NOTIFY_SOCKET", _notifyPath);
  std::array<int, 2> output;
  TL_ASSERT(pipe2(output.data(), O_CLOEXEC) == 0);
  _output = output[0];
  _pid = fork();
  TL_ASSERT(_pid >= 0);
  if (_pid == 0) run(arguments, environment, output[1], passedSockets);
  close(output[1]);
  _ended = static_cast<int>(syscall(SYS_pidfd_open, _pid, 0));
  TL_ASSERT(_ended >= 0);
}

void Process::run(const std::vector<std::string>& arguments, const Variables& environment,
                  int output, const std::vector<int>& passedSockets) const {
  prctl(PR_SET_PDEATHSIG, SIGKILL);
  for (const auto& [name, value] : environment) setenv(name.c_str(), value.c_str(), 1);
  dup2(output, STDOUT_FILENO);
  dup2(open(_log.c_str(), O_CREAT | O_WRONLY | O_APPEND | O_CLOEXEC, 0600), STDERR_FILENO);
  if (!passedSockets.empty()) {
    setenv("LISTEN_PID", std::to_string(getpid()).c_str(), 1);
    setenv("LISTEN_FDS", std::to_string(passedSockets.size()).c_str(), 1);
  }
  for (size_t i = 0; i < passedSockets.size(); ++i) {
    const int passed = kFirstPassedSocket + static_cast<int>(i);
    dup2(passedSockets[i], passed);
    fcntl(passed, F_SETFD, 0);  // which dup2 leaves alone if it is the same descriptor
  }
  std::vector<char*> words;
  for (const std::string& argument : arguments)
    words.push_back(const_cast<char*>(argument.c_str()));
  words.push_back(nullptr);
  execvp(words[0], words.data());
  _exit(127);
}

Process::~Process() {
  if (_pid > 0) end(SIGKILL);
  for (const int descriptor : {_notify, _output, _ended}) {
    if (descriptor >= 0) close(descriptor);
  }
}

bool Process::awaitReady() {
  for (;;) {
    std::array<pollfd, 2> descriptors{{{_notify, POLLIN, 0}, {_ended, POLLIN, 0}}};
    if (poll(descriptors.data(), descriptors.size(), -1) < 0) continue;
    if ((descriptors[0].revents & POLLIN) == 0) return false;
    std::array<char, 256> message{};
    if (recv(_notify, message.data(), message.size() - 1, 0) <= 0) continue;
    if (!std::string(message.data()).starts_with("READY=1")) continue;
    // What comes later would wait for somebody to take it.
    close(std::exchange(_notify, -1));
    return true;
  }
}

std::string Process::readLine() const {
  std::string line;
  char c = 0;
  while (read(_output, &c, 1) == 1 && c != '\n') line.push_back(c);
  return line;
}

void Process::signal(int number) const {
  kill(_pid, number);
}

int Process::end(int signal) {
  if (signal != 0) kill(_pid, signal);
  int status = 0;
  waitpid(_pid, &status, 0);
  _pid = -1;
  return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

size_t Process::anonymousKilobytes() const {
  std::ifstream status("/proc/" + std::to_string(_pid) + "/status");
  std::string name;
  size_t value = 0;
  while (status >> name) {
    if (name == "RssAnon:" && status >> value) return value;
  }
  return 0;
}

std::string Process::log() const {
  return platform::readFile(_log, kMaxFileBytes, nullptr).value_or("");
}

bool Process::waitForLog(const std::string& text) const {
  const platform::FileDescriptor changes(inotify_init1(IN_CLOEXEC));
  inotify_add_watch(changes.get(), _log.c_str(), IN_MODIFY);
  const auto found = [&] { return log().find(text) != std::string::npos; };
  while (!found()) {
    std::array<pollfd, 2> descriptors{{{changes.get(), POLLIN, 0}, {_ended, POLLIN, 0}}};
    poll(descriptors.data(), descriptors.size(), -1);
    if (descriptors[1].revents != 0) return found();
    std::array<char, 4096> events;
    [[maybe_unused]] const ssize_t n = read(changes.get(), events.data(), events.size());
  }
  return true;
}

void awaitFile(const std::string& directory, const std::string& name, const std::string& content) {
  const platform::FileDescriptor changes(inotify_init1(IN_CLOEXEC));
  TL_ASSERT(inotify_add_watch(changes.get(), directory.c_str(), IN_MOVED_TO | IN_CLOSE_WRITE) >= 0);
  std::array<char, 4096> events;
  while (platform::readFile(directory + '/' + name, kMaxFileBytes, nullptr) != content) {
    TL_ASSERT(read(changes.get(), events.data(), events.size()) > 0);
  }
}

}  // namespace testsupport
