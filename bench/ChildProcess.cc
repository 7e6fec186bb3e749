#include "bench/ChildProcess.h"

#include <fcntl.h>
#include <spawn.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <stdexcept>
#include <string_view>
#include <system_error>

#include "bench/DaemonRun.h"
#include "bench/MemoryWatch.h"

namespace bench {

namespace {

std::vector<char*> pointersTo(std::vector<std::string>& texts) {
  std::vector<char*> pointers;
  for (std::string& text : texts) pointers.push_back(text.data());
  pointers.push_back(nullptr);
  return pointers;
}

// The file descriptors of a program at its start.
class FileActions {
 public:
  FileActions(const std::string& output, const std::string& errors) {
    constexpr int kReplace = O_WRONLY | O_CREAT | O_TRUNC;
    posix_spawn_file_actions_init(&_actions);
    posix_spawn_file_actions_addopen(&_actions, STDIN_FILENO, "/dev/null", O_RDONLY, 0);
    posix_spawn_file_actions_addopen(&_actions, STDOUT_FILENO, output.c_str(), kReplace, 0600);
    posix_spawn_file_actions_addopen(&_actions, STDERR_FILENO, errors.c_str(), kReplace, 0600);
  }
  ~FileActions() { posix_spawn_file_actions_destroy(&_actions); }
  FileActions(const FileActions&) = delete;
  FileActions& operator=(const FileActions&) = delete;
  [[nodiscard]] const posix_spawn_file_actions_t* get() const { return &_actions; }

 private:
  posix_spawn_file_actions_t _actions;
};

// Unlike fork, does not copy this process, so its size does not affect the timing.
pid_t start(const Command& command) {
  std::vector<std::string> arguments = command.arguments;
  std::vector<std::string> environment = environmentWith(command.variables);
  const FileActions actions(command.output, errorsOf(command));
  pid_t process = -1;
  const int code = posix_spawnp(&process, arguments[0].c_str(), actions.get(), nullptr,
                                pointersTo(arguments).data(), pointersTo(environment).data());
  if (code != 0) throw std::system_error(code, std::generic_category(), arguments[0]);
  return process;
}

template <typename Wait>
void untilDone(const Wait& wait) {
  while (wait() < 0) {
    if (errno != EINTR) throw std::system_error(errno, std::generic_category(), "wait");
  }
}

// Waits for the end of the process but does not reap it.
void awaitEnd(pid_t process) {
  siginfo_t unused{};
  untilDone([&] { return waitid(P_PID, process, &unused, WEXITED | WNOWAIT); });
}

// Reaps the process and returns the processor time it used.
double reap(pid_t process, const Command& command) {
  int status = 0;
  rusage usage{};
  untilDone([&] { return wait4(process, &status, 0, &usage); });
  const auto& good = command.goodStatuses;
  if (!WIFEXITED(status) || std::count(good.begin(), good.end(), WEXITSTATUS(status)) == 0) {
    std::string text;
    for (const std::string& argument : command.arguments) text += argument + ' ';
    text += WIFEXITED(status) ? "ended with " + std::to_string(WEXITSTATUS(status)) : "was killed";
    std::ifstream errors(errorsOf(command));
    throw std::runtime_error(text + ": " + std::string(std::istreambuf_iterator<char>(errors), {}));
  }
  const auto seconds = [](const timeval& time) {
    return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_usec) / 1e6;
  };
  return seconds(usage.ru_utime) + seconds(usage.ru_stime);
}

}  // namespace

std::vector<std::string> environmentWith(const Variables& values) {
  std::vector<std::string> all;
  for (char** entry = environ; *entry != nullptr; ++entry) {
    const std::string_view text(*entry);
    const bool replaced = std::any_of(values.begin(), values.end(), [&](const auto& value) {
      return text.starts_with(value.first + '=');
    });
    if (!replaced) all.emplace_back(text);
  }
  for (const auto& [name, value] : values) all.push_back(name + '=' + value);
  return all;
}

std::string programBeside(const std::string& name) {
  return std::filesystem::read_symlink("/proc/self/exe").replace_filename(name);
}

std::string errorsOf(const Command& command) {
  return command.output + ".errors";
}

Run runProgram(const Command& command, bool watchMemory) {
  const double begin = secondsNow();
  const pid_t process = start(command);
  std::optional<MemoryWatch> watch;
  if (watchMemory) watch.emplace(process);
  awaitEnd(process);
  const double seconds = secondsNow() - begin;
  if (watch) watch->stop();
  const double cpuSeconds = reap(process, command);
  return {seconds, cpuSeconds, watch ? watch->memory().residentPeak : 0};
}

std::optional<std::string> versionOf(const std::string& program, const std::string& outputFile) {
  try {
    runProgram({{program, "--version"}, {}, outputFile}, false);
  } catch (const std::system_error& error) {
    if (error.code() == std::errc::no_such_file_or_directory) return std::nullopt;
    throw;
  }
  std::ifstream file(outputFile);
  std::string line;
  std::getline(file, line);
  return line.substr(line.find_last_of(' ') + 1);
}

}  // namespace bench
