#include <csignal>

#include "cli/Commands.h"
#include "platform/Log.h"

// The command-line client of tallowsearchd.
int main(int argc, char** argv) {
  // A reader of our output that goes away shows as a failed write.
  std::signal(SIGPIPE, SIG_IGN);
  // The commands tell what users need to know.
  platform::setProcessLogThreshold(platform::LogLevel::error);
  cli::ExitStatus status = cli::ExitStatus::failure;
  const auto options = cli::parseCommandLine(argc, argv, status);
  if (options) status = cli::runCommand(*options);
  return static_cast<int>(status);
}
