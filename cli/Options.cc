#include "cli/Options.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <array>
#include <iostream>
#include <limits>
#include <map>

#include "client/Channel.h"
#include "modification/WeightedDistance.h"

namespace cli {

namespace {

constexpr const char* kVersion = "tallow " TALLOW_VERSION;

// One command. `operands` is how its arguments are called in the help, null for none.
struct CommandRow {
  Command command;
  const char* name;
  const char* help;
  const char* operands;
  bool operandsRequired;
};

constexpr std::array<CommandRow, 16> kCommands{{
    {Command::index, "index", "Index mail: Maildirs, mbox files, messages, directories of these",
     "PATH", true},
    {Command::sync, "sync", "Bring the index in step with mailboxes: new, changed, moved, deleted",
     "PATH", false},
    {Command::watch, "watch", "Keep the index in step with mailboxes all the time", "PATH", false},
    {Command::status, "status", "Show mailboxes and index: what is indexed, waits or has failed",
     nullptr, false},
    {Command::search, "search", "Search; the last word matches as a prefix unless a blank follows",
     "WORDS", false},
    {Command::explain, "explain", "Search, and show how the query was understood and the scores",
     "WORDS", false},
    {Command::remove, "delete", "Delete messages by identifier", "ID", true},
    {Command::reset, "reset", "Delete everything that is indexed", nullptr, false},
    {Command::stats, "stats", "Show the statistics of store and index", nullptr, false},
    {Command::metrics, "metrics", "Show the metrics of the text index", nullptr, false},
    {Command::ping, "ping", "Ask the daemon whether it is there", "TEXT", false},
    {Command::vacuum, "vacuum", "Sort what is new into the index and compact it", nullptr, false},
    {Command::state, "state", "Show the state that a client has stored", nullptr, false},
    {Command::dump, "dump", "Print the text index, while no daemon runs", nullptr, false},
    {Command::validate, "validate", "Check the text index, while no daemon runs", nullptr, false},
    {Command::purge, "purge", "Remove what was deleted from the disk, while no daemon runs",
     nullptr, false},
}};

const std::map<std::string, OutputFormat> kFormats{{"text", OutputFormat::text},
                                                   {"json", OutputFormat::json},
                                                   {"files", OutputFormat::files},
                                                   {"message-ids", OutputFormat::messageIDs}};
const std::map<std::string, SortOrder> kSortOrders{{"relevance", SortOrder::relevance},
                                                   {"date", SortOrder::date}};
const std::map<std::string, ColorMode> kColors{
    {"auto", ColorMode::automatic}, {"always", ColorMode::always}, {"never", ColorMode::never}};

void addGlobalOptions(CLI::App& app, Options& options) {
  app.set_version_flag("--version", kVersion);
  app.add_option("--runtime-dir", options.runtimeDirectory, "Directory of the daemon's sockets")
      ->type_name("DIR");
  app.add_option("--state-dir", options.stateDirectory,
                 "Directory of the daemon's data, for dump, validate and purge")
      ->type_name("DIR");
  app.add_option("--class", options.protectionClass, "Protection class (default: default)")
      ->type_name("CLASS");
  app.add_option("--name", options.name, "Name of this client (default: tallow)")
      ->type_name("NAME");
  app.add_option("--format", options.format,
                 "Output: text, json, or for search also files or message-ids")
      ->transform(CLI::CheckedTransformer(kFormats).description(""))
      ->type_name("FORMAT");
  app.add_option("--limit", options.limit, "Most results of a search, 0 for all (default: 20)")
      ->check(CLI::Range(int64_t{0}, std::numeric_limits<int64_t>::max()).description(""))
      ->type_name("N");
  app.add_option("--color", options.color, "Colours: auto, always or never")
      ->transform(CLI::CheckedTransformer(kColors).description(""))
      ->type_name("WHEN");
  app.add_option("--wait", options.waitSeconds, "Wait so long for the daemon to come up")
      ->check(CLI::Range(0.0, 3600.0).description(""))
      ->type_name("SECONDS");
  app.add_flag("-y,--yes", options.yes, "Do not ask before a reset");
  app.add_flag("-v,--verbose", options.verbose, "Name what was cut or ignored");
}

bool isSearch(Command command) {
  return command == Command::search || command == Command::explain;
}

void addQueryOptions(CLI::App& sub, Options& options) {
  sub.add_option("--query", options.query,
                 "Search by an expression instead of words; see tallow-query(7)")
      ->type_name("EXPR");
  sub.add_option("--filter", options.filters, "Only what the expression holds for; may be repeated")
      ->allow_extra_args(false)
      ->type_name("EXPR");
  sub.add_option("--param", options.parameters, "Parameters of this search")
      ->type_name("KEY=VALUE,...");
}

void addResultOptions(CLI::App& sub, Options& options) {
  sub.add_option("--sort", options.sort, "Order: relevance, or date for the newest first")
      ->transform(CLI::CheckedTransformer(kSortOrders).description(""))
      ->type_name("ORDER");
  sub.add_option("--offset", options.offset, "Results to pass over")
      ->check(CLI::Range(int64_t{0}, std::numeric_limits<int64_t>::max() / 2).description(""))
      ->type_name("N");
  sub.add_flag("--count", options.count, "Show only how many results there are");
  sub.add_flag("--print0", options.print0, "Of files and message-ids: NUL in place of line feeds");
}

void addSyncOptions(CLI::App& sub, Options& options) {
  sub.add_flag("-n,--dry-run", options.dryRun, "Only tell what would be done");
  sub.add_flag("--prune-missing", options.pruneMissing,
               "Delete the mail of directories that are not there any more");
  sub.add_flag("--retry", options.retryFailed, "Try once more what could not be indexed");
}

void addCommand(CLI::App& app, const CommandRow& row, Options& options) {
  CLI::App* const sub = app.add_subcommand(row.name, row.help);
  sub->fallthrough();
  if (row.operands != nullptr) {
    CLI::Option* const operands = sub->add_option(row.operands, options.arguments);
    operands->required(row.operandsRequired)->type_name(" ");
    if (row.command == Command::ping) operands->expected(0, 1);
  }
  if (isSearch(row.command)) addQueryOptions(*sub, options);
  if (row.command == Command::search) addResultOptions(*sub, options);
  if (row.command == Command::sync) addSyncOptions(*sub, options);
  if (row.command == Command::purge) {
    sub->add_flag("-n,--dry-run", options.dryRun, "Only tell how much it would give back");
  }
  if (row.command == Command::watch) {
    sub->add_flag("--on-battery", options.onBattery, "Do not wait for power with much mail");
  }
  sub->callback([&options, command = row.command] { options.command = command; });
}

// After `search` and the like, a word that begins with a minus is not an option unless it is one of
// the short options. Its minus is replaced by a control character while the options are parsed.
constexpr char kMinusOfWord = '\x01';

std::vector<std::string> withMarkedWords(int argc, const char* const* argv) {
  std::vector<std::string> arguments(argv + 1, argv + argc);
  bool searches = false;
  for (std::string& argument : arguments) {
    if (argument == "--") break;
    const bool isShort = argument == "-h" || argument == "-v" || argument == "-y";
    if (searches && argument.size() > 1 && argument[0] == '-' && argument[1] != '-' && !isShort) {
      argument[0] = kMinusOfWord;
    }
    searches = searches || argument == "search" || argument == "explain";
  }
  return arguments;
}

void restoreWords(std::vector<std::string>& words) {
  for (std::string& word : words) {
    if (word.starts_with(kMinusOfWord)) word[0] = '-';
  }
}

// The command that was meant by a mistyped one, or null.
const char* nearestCommand(const std::string& word) {
  constexpr float kMostMistakes = 2;
  float least = 0.6F;  // two mistakes, at most
  const char* nearest = nullptr;
  for (const CommandRow& row : kCommands) {
    const float distance = weightedDistance(word, row.name, kMostMistakes, 1);
    if (distance >= least) continue;
    least = distance;
    nearest = row.name;
  }
  return nearest;
}

// A word where the command should be; empty when something else is wrong.
std::string unknownCommand(const CLI::App& app) {
  if (!app.get_subcommands().empty()) return "";
  for (const std::string& word : app.remaining()) {
    if (!word.starts_with('-')) return word;
  }
  return "";
}

void complainOfCommand(const std::string& word) {
  std::cerr << "tallow: there is no command \"" << cleanForTerminal(word) << '"';
  if (const char* const meant = nearestCommand(word))
    std::cerr << "; did you mean " << meant << '?';
  std::cerr << "\nRun `tallow help` for the list.\n";
}

// Of the command `help`: the help of the command with that name, or the list of all.
ExitStatus showHelp(CLI::App& app, const std::string& command) {
  if (command.empty()) {
    std::cout << app.help();
    return ExitStatus::done;
  }
  const auto isMeant = [&command](const CLI::App* sub) { return sub->get_name() == command; };
  const std::vector<CLI::App*> found = app.get_subcommands(isMeant);
  if (found.empty()) {
    complainOfCommand(command);
    return ExitStatus::failure;
  }
  std::cout << found.front()->help("tallow");
  return ExitStatus::done;
}

// What is wrong with options that do not go together, or null.
const char* misuse(const Options& options) {
  const bool list =
      options.format == OutputFormat::files || options.format == OutputFormat::messageIDs;
  if (list && options.command != Command::search) {
    return "--format=files and --format=message-ids are for search only";
  }
  if (options.print0 && !list) return "--print0 goes with --format=files or --format=message-ids";
  if (options.format == OutputFormat::json && options.command == Command::dump) {
    return "a dump is text only";
  }
  if (!isSearch(options.command)) return nullptr;
  if (options.arguments.empty() == options.query.empty()) {
    return "a search is for WORDS, or for the expression of --query";
  }
  if (!options.query.empty() && !options.filters.empty()) {
    return "--filter goes with WORDS; in the expression of --query, join conditions with &&";
  }
  return nullptr;
}

}  // namespace

std::optional<Options> parseCommandLine(int argc, const char* const* argv, ExitStatus& status) {
  Options options;
  CLI::App app("Full-text search of personal mail; a client of tallowsearchd.", "tallow");
  app.require_subcommand(1);
  app.failure_message(CLI::FailureMessage::simple);
  addGlobalOptions(app, options);
  for (const CommandRow& row : kCommands) addCommand(app, row, options);
  std::string helpOn;
  CLI::App* const help = app.add_subcommand("help", "Show how a command is used");
  help->add_option("COMMAND", helpOn)->type_name(" ");
  try {
    std::vector<std::string> arguments = withMarkedWords(argc, argv);
    std::reverse(arguments.begin(), arguments.end());
    app.parse(std::move(arguments));
    restoreWords(options.arguments);
    options.classGiven = app.count("--class") > 0;
  } catch (const CLI::ParseError& error) {
    const std::string word = unknownCommand(app);
    if (error.get_exit_code() != 0 && !word.empty()) {
      complainOfCommand(word);
      status = ExitStatus::failure;
      return std::nullopt;
    }
    status = app.exit(error) == 0 ? ExitStatus::done : ExitStatus::failure;
    return std::nullopt;
  }
  if (help->parsed()) {
    status = showHelp(app, helpOn);
    return std::nullopt;
  }
  if (const char* const misused = misuse(options)) {
    std::cerr << "tallow: " << misused << '\n';
    status = ExitStatus::failure;
    return std::nullopt;
  }
  if (options.runtimeDirectory.empty()) {
    options.runtimeDirectory = client::defaultRuntimeDirectory();
  }
  return options;
}

}  // namespace cli
