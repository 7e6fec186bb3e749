#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "cli/Terminal.h"

namespace cli {

// The exit status of the program.
enum class ExitStatus : int {
  done = 0,
  nothingFound = 1,
  failure = 2,       // also incorrect usage
  inUse = 3,         // the index can be read only while no daemon is running
  unreachable = 75,  // the daemon cannot be reached
};

enum class Command {
  index,
  search,
  explain,
  remove,
  reset,
  stats,
  metrics,
  ping,
  vacuum,
  state,
  dump,
  validate,
  sync,
  status,
  purge,
  watch,
  show,
  address,
  save,
  screen,
  setup,
  mcp  // serves search and reading to another program
};
enum class OutputFormat { text, json, files, messageIDs };
enum class SortOrder { relevance, date };

struct Options {
  Command command = Command::ping;
  std::vector<std::string> arguments;  // paths, words, identifiers or a text
  std::string query;                   // an expression instead of words
  std::vector<std::string> filters;    // expressions in addition to words
  std::string parameters;              // key=value,...

  std::string runtimeDirectory;
  std::string stateDirectory;  // empty: the daemon's default
  std::string protectionClass = "default";
  bool classGiven = false;  // by the user
  std::string name = "tallow";
  OutputFormat format = OutputFormat::text;
  ColorMode color = ColorMode::automatic;
  int64_t limit = 20;  // 0 for all
  int64_t offset = 0;  // results to skip
  SortOrder sort = SortOrder::relevance;
  bool count = false;      // only the number of results
  bool print0 = false;     // end each entry of a list with NUL
  double waitSeconds = 0;  // for the daemon to start
  bool yes = false;
  bool verbose = false;

  bool threads = false;  // results by conversation
  std::string maildir;   // the folder for links to the results; empty for none
  // Only mail in one of these folders, in addition to words; empty for all.
  std::vector<std::string> folders;

  // For show.
  bool raw = false;
  int64_t attachment = 0;  // by number from 1; 0 for none
  std::string output;      // the file to save it in, or "-"
  bool force = false;      // replace the file

  // For address and save.
  bool mutt = false;
  bool removeSaved = false;

  // For status.
  std::string page;  // the file for the HTML page

  // For index, sync and watch: whether the text of attachments is indexed, by the user.
  std::optional<bool> attachments;

  // For sync; the first also for setup and purge.
  bool dryRun = false;
  bool pruneMissing = false;
  bool retryFailed = false;
  bool reread = false;

  // For watch.
  bool onBattery = false;  // large backlogs do not wait for power

  [[nodiscard]] std::chrono::milliseconds patience() const {
    return std::chrono::milliseconds(static_cast<int64_t>(waitSeconds * 1000));
  }
};

// Whether a search is only to remove the links of an earlier one.
[[nodiscard]] inline bool emptiesMaildir(const Options& options) {
  return !options.maildir.empty() && options.arguments.empty() && options.query.empty();
}

// Parses the command line. Without a command on a terminal, the command is Command::screen. Nullopt
// if there is nothing more to do, after --help, --version or incorrect usage; the text has then
// been printed and `status` is the exit status.
[[nodiscard]] std::optional<Options> parseCommandLine(int argc, const char* const* argv,
                                                      ExitStatus& status);

}  // namespace cli
