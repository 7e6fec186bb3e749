#include <csignal>

#include "cli/Commands.h"
#include "mcp/Server.h"
#include "platform/Log.h"
#include "screen/Screen.h"

namespace {

cli::ExitStatus run(const cli::Options& options) {
  switch (options.command) {
    case cli::Command::screen:
      return mailscreen::runScreen(options);
    case cli::Command::mcp:
      return mcp::runServer(options);
    default:
      return cli::runCommand(options);
  }
}

}  // namespace

// The command-line client of tallowsearchd.
int main(int argc, char** argv) {
  // If the reader of our output closes the pipe, the write fails instead.
  std::signal(SIGPIPE, SIG_IGN);
  // The commands report what users need to know.
  platform::setProcessLogThreshold(platform::LogLevel::error);
  cli::ExitStatus status = cli::ExitStatus::failure;
  const auto options = cli::parseCommandLine(argc, argv, status);
  if (options) status = run(*options);
  return static_cast<int>(status);
}
