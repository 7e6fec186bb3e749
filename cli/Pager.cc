#include "cli/Pager.h"

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <string>

#include "cli/Commands.h"
#include "cli/ShellCommand.h"
#include "platform/FileDescriptor.h"

namespace cli {

namespace {

// The exit status of a shell if a program does not exist.
constexpr int kNotFound = 127;

std::string pagerCommand() {
  const char* const pager = std::getenv("PAGER");
  return pager == nullptr ? "less -R" : pager;
}

// While a pager uses the terminal, Ctrl-C and Ctrl-\ are for the pager: this process ignores them.
class IgnoredSignals {
 public:
  IgnoredSignals()
      : _interrupt(std::signal(SIGINT, SIG_IGN)), _quit(std::signal(SIGQUIT, SIG_IGN)) {}
  ~IgnoredSignals() {
    std::signal(SIGINT, _interrupt);
    std::signal(SIGQUIT, _quit);
  }
  IgnoredSignals(const IgnoredSignals&) = delete;
  IgnoredSignals& operator=(const IgnoredSignals&) = delete;

 private:
  void (*const _interrupt)(int);
  void (*const _quit)(int);
};

// Stops when the reader has closed the pipe.
void writeAll(int output, std::string_view text) {
  while (!text.empty()) {
    const ssize_t count = ::write(output, text.data(), text.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return;
    text.remove_prefix(static_cast<size_t>(count));
  }
}

}  // namespace

ExitStatus page(std::string_view text) {
  const std::string command = pagerCommand();
  if (isatty(STDOUT_FILENO) != 1 || command.empty() || command == "cat") return print(text);
  std::array<int, 2> pipe{-1, -1};
  if (pipe2(pipe.data(), O_CLOEXEC) != 0) return print(text);
  platform::FileDescriptor output(pipe[1]);
  platform::FileDescriptor input(pipe[0]);
  const IgnoredSignals ignored;
  // Without R, less shows escape sequences as text.
  setenv("LESS", "R", 0);
  pid_t process = -1;
  if (startShell(command, {}, input.get(), process) != 0) return print(text);
  input.reset();
  writeAll(output.get(), text);
  output.reset();
  int status = 0;
  while (waitpid(process, &status, 0) < 0 && errno == EINTR) {
  }
  return WIFEXITED(status) && WEXITSTATUS(status) == kNotFound ? print(text) : ExitStatus::done;
}

}  // namespace cli
