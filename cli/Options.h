#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "cli/Terminal.h"

namespace cli {

// What a program ends with.
enum class ExitStatus : int {
  done = 0,
  nothingFound = 1,
  failure = 2,       // also wrong use
  inUse = 3,         // an index that can be looked at only while no daemon runs
  unreachable = 75,  // of the daemon
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
  screen  // search as you type
};
enum class OutputFormat { text, json, files, messageIDs };
enum class SortOrder { relevance, date };

struct Options {
  Command command = Command::ping;
  std::vector<std::string> arguments;  // of the command: paths, words, identifiers or a text
  std::string query;                   // an expression in place of words
  std::vector<std::string> filters;    // expressions beside words
  std::string parameters;              // key=value,...

  std::string runtimeDirectory;
  std::string stateDirectory;  // empty: where the daemon has it by itself
  std::string protectionClass = "default";
  bool classGiven = false;  // by the user
  std::string name = "tallow";
  OutputFormat format = OutputFormat::text;
  ColorMode color = ColorMode::automatic;
  int64_t limit = 20;  // 0 for all
  int64_t offset = 0;  // results that are passed over
  SortOrder sort = SortOrder::relevance;
  bool count = false;      // only the number of results
  bool print0 = false;     // end each entry of a list with NUL
  double waitSeconds = 0;  // for the daemon to come up
  bool yes = false;
  bool verbose = false;

  bool threads = false;  // results by conversation
  std::string folder;    // beside words: only mail in this folder, as folder:NAME; empty for all

  // Of show.
  bool raw = false;
  int64_t attachment = 0;  // by number from 1; 0 for none
  std::string output;      // the file to save it in, or "-"
  bool force = false;      // replace the file

  // Of address and save.
  bool mutt = false;
  bool removeSaved = false;

  // Of sync.
  bool dryRun = false;
  bool pruneMissing = false;
  bool retryFailed = false;

  // Of watch.
  bool onBattery = false;  // large backlogs do not wait for power

  [[nodiscard]] std::chrono::milliseconds patience() const {
    return std::chrono::milliseconds(static_cast<int64_t>(waitSeconds * 1000));
  }
};

// Reads the command line. Without a command on a terminal that is Command::screen. When the program
// has nothing more to do, after --help, --version or wrong use, it has been told on the standard
// output or error, and `status` is what to end with.
[[nodiscard]] std::optional<Options> parseCommandLine(int argc, const char* const* argv,
                                                      ExitStatus& status);

}  // namespace cli
