#include "mcp/Server.h"

#include <unistd.h>

#include "cli/Commands.h"
#include "cli/Settings.h"
#include "mcp/LineInput.h"
#include "mcp/Session.h"

namespace mcp {

namespace {

// Those of the command line, else those of the settings. Nullopt after a message to the user.
std::optional<FolderLimit> folderLimit(const cli::Options& options) {
  std::vector<std::string> folders = options.folders;
  if (folders.empty()) {
    auto settings = cli::readSettings();
    if (const auto* const wrong = std::get_if<std::string>(&settings)) {
      cli::complain(*wrong);
      return std::nullopt;
    }
    folders = std::move(std::get<cli::Settings>(settings).mcpFolders);
  }
  auto limit = FolderLimit::of(folders);
  if (const auto* const wrong = std::get_if<std::string>(&limit)) {
    cli::complain(*wrong);
    return std::nullopt;
  }
  return std::get<FolderLimit>(std::move(limit));
}

}  // namespace

cli::ExitStatus runServer(const cli::Options& options) {
  auto limit = folderLimit(options);
  if (!limit) return cli::ExitStatus::failure;
  MailTools tools(options, std::move(*limit));
  Session session(tools, TALLOW_VERSION);
  LineInput input(STDIN_FILENO);
  while (const auto line = input.next()) {
    const std::string reply =
        line->tooLong ? Session::refuseLongLine() : session.answer(line->text);
    if (reply.empty()) continue;
    if (cli::print(reply + '\n') != cli::ExitStatus::done) return cli::ExitStatus::failure;
  }
  return cli::ExitStatus::done;
}

}  // namespace mcp
