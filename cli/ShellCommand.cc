#include "cli/ShellCommand.h"

#include <spawn.h>
#include <unistd.h>

#include <csignal>
#include <cstdlib>

namespace cli {

int startShell(const std::string& command, const std::vector<std::string>& arguments, int input,
               pid_t& process) {
  std::vector<const char*> words{"sh", "-c", command.c_str()};
  if (!arguments.empty()) words.push_back("sh");  // "$0"
  for (const std::string& argument : arguments) words.push_back(argument.c_str());
  words.push_back(nullptr);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_adddup2(&actions, input, STDIN_FILENO);
  posix_spawnattr_t attributes;
  posix_spawnattr_init(&attributes);
  sigset_t usual;
  sigemptyset(&usual);
  posix_spawnattr_setsigmask(&attributes, &usual);
  for (const int signal : {SIGPIPE, SIGINT, SIGQUIT, SIGTSTP}) sigaddset(&usual, signal);
  posix_spawnattr_setsigdefault(&attributes, &usual);
  posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETSIGMASK);
  const int result = posix_spawn(&process, "/bin/sh", &actions, &attributes,
                                 const_cast<char* const*>(words.data()), environ);
  posix_spawnattr_destroy(&attributes);
  posix_spawn_file_actions_destroy(&actions);
  return result;
}

std::optional<std::string> openingCommand() {
  const char* const program = std::getenv("TALLOW_OPEN");
  if (program == nullptr || *program == '\0') return std::nullopt;
  return std::string(program) + " \"$1\"";
}

}  // namespace cli
