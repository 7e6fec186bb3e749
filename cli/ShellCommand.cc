#include "cli/ShellCommand.h"

#include <unistd.h>

#include <csignal>
#include <cstdlib>

#include "platform/SpawnPlan.h"

namespace cli {

int startShell(const std::string& command, const std::vector<std::string>& arguments, int input,
               pid_t& process) {
  std::vector<std::string> words{"/bin/sh", "-c", command, "sh"};  // the last is "$0"
  words.insert(words.end(), arguments.begin(), arguments.end());
  platform::SpawnPlan plan;
  plan.pass(input, STDIN_FILENO).blockSignals({});
  plan.resetSignals({SIGPIPE, SIGINT, SIGQUIT, SIGTSTP});
  return plan.run(words, process);
}

std::optional<std::string> openingCommand() {
  const char* const program = std::getenv("TALLOW_OPEN");
  if (program == nullptr || *program == '\0') return std::nullopt;
  return std::string(program) + " \"$1\"";
}

}  // namespace cli
