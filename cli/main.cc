#include <csignal>

#include "cli/Commands.h"
#include "platform/Log.h"
#include "screen/Screen.h"

// The command-line client of tallowsearchd.
int main(int argc, char** argv) {
  // If the reader of our output closes the pipe, the write fails instead.
  std::signal(SIGPIPE, SIG_IGN);
  // The commands report what users need to know.
  platform::setProcessLogThreshold(platform::LogLevel::error);
  cli::ExitStatus status = cli::ExitStatus::failure;
  const auto options = cli::parseCommandLine(argc, argv, status);
  if (options) {
    status = options->command == cli::Command::screen ? mailscreen::runScreen(*options)
                                                      : cli::runCommand(*options);
  }
  return static_cast<int>(status);
}
