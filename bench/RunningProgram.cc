#include "bench/RunningProgram.h"

#include <fcntl.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <stdexcept>
#include <system_error>
#include <utility>

#include "bench/DaemonRun.h"
#include "bench/MemoryWatch.h"

namespace bench {

namespace {

// The child: only calls that are safe between fork and exec.
[[noreturn]] void become(const std::vector<char*>& arguments, const std::vector<char*>& environment,
                         const std::string& output, const std::string& errors, pid_t parent) {
  prctl(PR_SET_PDEATHSIG, SIGKILL);
  if (getppid() != parent) _exit(127);
  constexpr int kReplace = O_WRONLY | O_CREAT | O_TRUNC;
  const int files[] = {open("/dev/null", O_RDONLY), open(output.c_str(), kReplace, 0600),
                       open(errors.c_str(), kReplace, 0600)};
  for (int i = 0; i < 3; ++i) dup2(files[i], i);
  execvpe(arguments[0], arguments.data(), environment.data());
  _exit(127);
}

std::vector<char*> pointersTo(std::vector<std::string>& texts) {
  std::vector<char*> pointers;
  for (std::string& text : texts) pointers.push_back(text.data());
  pointers.push_back(nullptr);
  return pointers;
}

}  // namespace

RunningProgram::RunningProgram(const Command& command) : _command(command) {
  std::vector<std::string> arguments = command.arguments;
  std::vector<std::string> environment = environmentWith(command.variables);
  const auto argumentPointers = pointersTo(arguments);
  const auto environmentPointers = pointersTo(environment);
  const std::string errors = errorsOf(command);
  const pid_t parent = getpid();
  _pid = fork();
  if (_pid < 0) throw std::system_error(errno, std::generic_category(), "fork");
  if (_pid == 0) become(argumentPointers, environmentPointers, command.output, errors, parent);
}

RunningProgram::~RunningProgram() {
  if (_pid >= 0) end(SIGKILL);
}

double RunningProgram::cpuSeconds() const {
  return cpuSecondsOf(_pid);
}

uint64_t RunningProgram::sleeps() const {
  return statusNumber(_pid, "voluntary_ctxt_switches:");
}

int RunningProgram::end(int signal) {
  const pid_t pid = std::exchange(_pid, -1);
  int status = 0;
  kill(pid, signal);
  while (waitpid(pid, &status, 0) < 0 && errno == EINTR) {
  }
  return status;
}

void RunningProgram::stop() {
  const int status = end(SIGTERM);
  const auto& good = _command.goodStatuses;
  if (!WIFEXITED(status) || std::count(good.begin(), good.end(), WEXITSTATUS(status)) == 0) {
    throw std::runtime_error(_command.arguments.front() + " did not end well");
  }
}

}  // namespace bench
