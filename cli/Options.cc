#include "cli/Options.h"

#include <fmt/format.h>
#include <unistd.h>

#include <CLI/CLI.hpp>
#include <algorithm>
#include <cstdlib>
#include <iostream>
#include <limits>
#include <map>

#include "cli/Arguments.h"
#include "cli/Completion.h"
#include "cli/Examples.h"
#include "cli/NearestName.h"
#include "rpc/Channel.h"

namespace cli {

namespace {

constexpr const char* kVersion = "tallow " TALLOW_VERSION;

// One command. `operands` names its arguments in the help; null if it has none.
struct CommandRow {
  Command command;
  const char* name;
  const char* help;
  const char* operands;
  bool operandsRequired;
};

constexpr CommandRow kCommands[] = {
    {Command::setup, "setup", "Find your mail, keep it indexed from now on, and index it now",
     "PATH", false},
    {Command::index, "index", "Index mail: Maildirs, mbox files, messages, directories of these",
     "PATH", true},
    {Command::sync, "sync", "Bring the index in step with mailboxes: new, changed, moved, deleted",
     "PATH", false},
    {Command::watch, "watch", "Keep the index in step with mailboxes all the time", "PATH", false},
    {Command::status, "status", "Show mailboxes and index: indexed, waiting and failed messages",
     nullptr, false},
    {Command::search, "search", "Search; the last word matches as a prefix unless a space follows",
     "WORDS", false},
    {Command::screen, "screen", "Search as you type, on a terminal", "WORDS", false},
    {Command::explain, "explain", "Search, and show how the query was understood and the scores",
     "WORDS", false},
    {Command::remove, "delete", "Delete messages and folders from the index, not from the disk",
     "PATH|ID", true},
    {Command::reset, "reset", "Delete everything that is indexed", nullptr, false},
    {Command::stats, "stats", "Show the statistics of store and index", nullptr, false},
    {Command::metrics, "metrics", "Show the metrics of the text index", nullptr, false},
    {Command::ping, "ping", "Check whether the daemon is running", "TEXT", false},
    {Command::vacuum, "vacuum", "Merge new mail into the index and compact it", nullptr, false},
    {Command::state, "state", "Show the state that a client has stored", nullptr, false},
    {Command::dump, "dump", "Print the text index, while no daemon runs", nullptr, false},
    {Command::validate, "validate", "Check the text index, while no daemon runs", nullptr, false},
    {Command::purge, "purge", "Remove deleted mail from the disk, while no daemon runs", nullptr,
     false},
    {Command::show, "show", "Show a message", "RANK|ID|PATH", true},
    {Command::address, "address", "Complete names and addresses from the indexed mail", "WORD",
     true},
    {Command::save, "save", "Save a search as @NAME, or list the saved searches", "NAME WORDS",
     false},
    {Command::mcp, "mcp", "Serve search and reading of some folders to another program", nullptr,
     false},
};

const std::map<std::string, OutputFormat> kFormats{{"text", OutputFormat::text},
                                                   {"json", OutputFormat::json},
                                                   {"files", OutputFormat::files},
                                                   {"message-ids", OutputFormat::messageIDs}};
const std::map<std::string, SortOrder> kSortOrders{{"relevance", SortOrder::relevance},
                                                   {"date", SortOrder::date}};
const std::map<std::string, ColorMode> kColors{
    {"auto", ColorMode::automatic}, {"always", ColorMode::always}, {"never", ColorMode::never}};

// Accepts one of several names and replaces it by the number of its value. The validator's own name
// lists them, for completions.
template <typename Value>
CLI::Validator oneOf(const std::map<std::string, Value>& values) {
  std::vector<std::string> names;
  for (const auto& [name, value] : values) names.push_back(name);
  return CLI::Validator(
      [values, names](std::string& text) -> std::string {
        const auto found = values.find(text);
        if (found == values.end()) {
          return fmt::format("\"{}\" is not one of {}", text, fmt::join(names, ", "));
        }
        text = std::to_string(static_cast<int>(found->second));
        return {};
      },
      "", fmt::format("{}", fmt::join(names, " ")));
}

CLI::Validator wholeNumber(int64_t least) {
  return CLI::Validator(
      [least](std::string& text) -> std::string {
        int64_t number = 0;
        const bool good = CLI::detail::lexical_cast(text, number) && number >= least &&
                          number <= std::numeric_limits<int64_t>::max() / 2;
        return good ? "" : fmt::format("\"{}\" is not a whole number from {} on", text, least);
      },
      "");
}

CLI::Validator seconds(double most) {
  return CLI::Validator(
      [most](std::string& text) -> std::string {
        double number = 0;
        const bool good = CLI::detail::lexical_cast(text, number) && number >= 0 && number <= most;
        return good ? "" : fmt::format("\"{}\" is not a number from 0 to {}", text, most);
      },
      "");
}

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
      ->transform(oneOf(kFormats))
      ->type_name("FORMAT");
  app.add_option("--limit", options.limit, "Maximum number of results, 0 for all (default: 20)")
      ->check(wholeNumber(0))
      ->type_name("N");
  app.add_option("--color", options.color, "Colours: auto, always or never")
      ->transform(oneOf(kColors))
      ->type_name("WHEN");
  app.add_option("--wait", options.waitSeconds, "How long to wait for the daemon to start")
      ->check(seconds(3600))
      ->type_name("SECONDS");
  app.add_flag("-y,--yes", options.yes, "Do not ask: setup takes all mail it finds, reset deletes");
  app.add_flag("-v,--verbose", options.verbose, "List cut messages and ignored files");
}

bool isSearch(Command command) {
  return command == Command::search || command == Command::explain;
}

bool sendsMail(Command command) {
  return command == Command::index || command == Command::sync || command == Command::watch;
}

void addQueryOptions(CLI::App& sub, Options& options) {
  sub.add_option("--query", options.query,
                 "Search by an expression instead of words; see tallow-query(7)")
      ->type_name("EXPR");
  sub.add_option("--filter", options.filters,
                 "Only messages that match the expression; may be repeated")
      ->allow_extra_args(false)
      ->type_name("EXPR");
  sub.add_option("--param", options.parameters, "Parameters of this search")
      ->type_name("KEY=VALUE,...");
}

void addResultOptions(CLI::App& sub, Options& options) {
  sub.add_option("--sort", options.sort, "Order: relevance, or date for the newest first")
      ->transform(oneOf(kSortOrders))
      ->type_name("ORDER");
  sub.add_option("--offset", options.offset, "Number of results to skip")
      ->check(wholeNumber(0))
      ->type_name("N");
  sub.add_flag("--count", options.count, "Show only how many results there are");
  sub.add_option("--maildir", options.maildir,
                 "Make this Maildir of links to the results; without WORDS, empty it")
      ->type_name("DIR");
  sub.add_flag("--threads", options.threads, "A line for each conversation, with its results");
  sub.add_flag("--print0", options.print0, "With files and message-ids: end each entry with NUL");
}

void addShowOptions(CLI::App& sub, Options& options) {
  sub.add_flag("--raw", options.raw, "The original message");
  sub.add_option("--attachment", options.attachment, "Save the attachment with this number")
      ->check(wholeNumber(1))
      ->type_name("N");
  sub.add_option("-o,--output", options.output, "File to write, or - for the standard output")
      ->type_name("FILE");
  sub.add_flag("--force", options.force, "Replace the file if there is one");
}

void addSyncOptions(CLI::App& sub, Options& options) {
  sub.add_flag("-n,--dry-run", options.dryRun, "Only show what would be done");
  sub.add_flag("--prune-missing", options.pruneMissing,
               "Delete the mail of directories that no longer exist");
  sub.add_flag("--retry", options.retryFailed, "Retry messages that could not be indexed");
  sub.add_flag("--reread", options.reread, "Read and send everything again");
}

void addAttachmentOptions(CLI::App& sub, Options& options) {
  sub.add_flag_callback(
      "--attachments", [&options] { options.attachments = true; },
      "Index the text of attachments, whatever the settings say");
  sub.add_flag_callback(
      "--no-attachments", [&options] { options.attachments = false; }, "Do not index it");
}

void addCommand(CLI::App& app, const CommandRow& row, Options& options) {
  CLI::App* const sub = app.add_subcommand(row.name, row.help);
  sub->fallthrough();
  if (row.operands != nullptr) {
    CLI::Option* const operands = sub->add_option(row.operands, options.arguments);
    operands->required(row.operandsRequired)->type_name(" ");
    if (row.command == Command::ping) operands->expected(0, 1);
    if (row.command == Command::show) operands->expected(1);
  }
  if (isSearch(row.command)) addQueryOptions(*sub, options);
  if (row.command == Command::search) addResultOptions(*sub, options);
  if (row.command == Command::sync) addSyncOptions(*sub, options);
  if (row.command == Command::status) {
    sub->add_option("--html", options.page, "Write it as a page for browsers, with charts")
        ->type_name("FILE");
  }
  if (sendsMail(row.command)) addAttachmentOptions(*sub, options);
  if (row.command == Command::setup) {
    sub->add_flag("-n,--dry-run", options.dryRun, "Only show what would be done");
  }
  if (row.command == Command::purge) {
    sub->add_flag("-n,--dry-run", options.dryRun, "Only show how much space it would free");
  }
  if (row.command == Command::watch) {
    sub->add_flag("--on-battery", options.onBattery, "Send large backlogs on battery, too");
  }
  if (row.command == Command::show) addShowOptions(*sub, options);
  if (row.command == Command::address) {
    sub->add_flag("--mutt", options.mutt, "Begin with the line that mutt's query_command skips");
  }
  if (row.command == Command::save) {
    sub->add_flag("--delete", options.removeSaved, "Delete the saved search with this name");
  }
  if (row.command == Command::mcp) {
    sub->add_option("--folder", options.folders, "Folder whose mail may be shown; may be repeated")
        ->allow_extra_args(false)
        ->type_name("DIR");
  }
  sub->footer(examplesOf(row.command));
  sub->callback([&options, command = row.command] { options.command = command; });
}

// The word in place of a command; empty if something else is wrong.
std::string unknownCommand(const CLI::App& app) {
  if (!app.get_subcommands().empty()) return "";
  for (const std::string& word : app.remaining()) {
    if (!word.starts_with('-')) return word;
  }
  return "";
}

void complainOfCommand(const std::string& word) {
  std::cerr << "tallow: there is no command \"" << cleanForTerminal(word) << '"';
  if (const char* const meant = nearestName(word, kCommands))
    std::cerr << "; did you mean " << meant << '?';
  std::cerr << "\nRun `tallow help` for the list.\n";
}

// Explains what is wrong with a command line.
std::string reasonOf(const CLI::App& app, const CLI::Error& error) {
  const auto is = [code = error.get_exit_code()](CLI::ExitCodes one) {
    return code == static_cast<int>(one);
  };
  const auto commands = app.get_subcommands();
  std::string reason = error.what();
  if (is(CLI::ExitCodes::ExtrasError)) {
    std::vector<std::string> left = app.remaining();
    if (left.empty() && !commands.empty()) left = commands.front()->remaining();
    if (left.empty()) return reason;
    return left.front().starts_with('-')
               ? "there is no option " + left.front()
               : fmt::format("\"{}\" is one argument too many", left.front());
  }
  if (is(CLI::ExitCodes::RequiredError) && commands.empty()) return "a command is missing";
  if (is(CLI::ExitCodes::ArgumentMismatch)) {
    const std::string name = reason.substr(0, reason.find(':'));
    return name + (name.starts_with('-') ? " needs a value" : " can be given only once");
  }
  return reason;
}

std::string misuseText(const CLI::App* app, const CLI::Error& error) {
  const auto commands = app->get_subcommands();
  return fmt::format("tallow: {}\nRun `tallow help{}` for what there is.\n",
                     cleanForTerminal(reasonOf(*app, error)),
                     commands.empty() ? "" : ' ' + commands.front()->get_name());
}

// For the command `help`: the help of the named command, or the list of all commands.
ExitStatus showHelp(CLI::App& app, const std::string& command) {
  if (command.empty()) {
    // app.help() would be that of `help`.
    std::cout << app.get_formatter()->make_help(&app, app.get_name(), CLI::AppFormatMode::Normal);
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

// For the hidden command `completion`, which the build runs.
ExitStatus showCompletion(CLI::App& app, const std::string& shell) {
  const auto script = completionScript(completionTable(app), shell);
  if (script) return std::cout << *script << std::flush ? ExitStatus::done : ExitStatus::failure;
  std::cerr << "tallow: there are completions for bash, zsh and fish\n";
  return ExitStatus::failure;
}

// Whether input and output are a terminal that a screen can be drawn on.
bool isScreen() {
  const char* const terminal = std::getenv("TERM");
  return isatty(STDIN_FILENO) == 1 && isatty(STDOUT_FILENO) == 1 && terminal != nullptr &&
         *terminal != '\0' && std::string_view(terminal) != "dumb";
}

const char* misuseOfShow(const Options& options) {
  if (options.raw && options.attachment != 0) return "--raw does not go with --attachment";
  if ((options.attachment != 0) != !options.output.empty()) {
    return "--attachment N and -o FILE go together";
  }
  if (options.force && options.output.empty()) return "--force goes with -o FILE";
  return nullptr;
}

// An error about options that cannot be combined, or null.
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
  if (options.format == OutputFormat::json && options.command == Command::setup) {
    return "a setup is text only";
  }
  if (!options.page.empty() && options.format != OutputFormat::text) {
    return "--html and --format are two forms of one output";
  }
  if (options.command == Command::show) return misuseOfShow(options);
  if (options.command == Command::screen && !isScreen()) return "a screen needs a terminal";
  if (!isSearch(options.command)) return nullptr;
  if (!options.maildir.empty() && (list || options.count || options.threads)) {
    return "--maildir shows no list; it goes with --format=text or json only";
  }
  if (emptiesMaildir(options)) return nullptr;
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
  app.require_subcommand(isScreen() ? 0 : 1, 1);
  app.footer("Without a command, on a terminal: tallow screen.");
  app.failure_message(misuseText);
  addGlobalOptions(app, options);
  for (const CommandRow& row : kCommands) addCommand(app, row, options);
  std::string helpOn;
  CLI::App* const help = app.add_subcommand("help", "Show how a command is used");
  help->fallthrough();
  help->add_option("COMMAND", helpOn)->type_name(" ");
  std::string shell;
  CLI::App* const completion = app.add_subcommand("completion", "Complete commands in a shell");
  completion->group("")->add_option("SHELL", shell)->type_name(" ");
  try {
    std::vector<std::string> arguments = commandFirst(argc, argv, app);
    std::reverse(arguments.begin(), arguments.end());
    app.parse(std::move(arguments));
    restoreWords(options.arguments);
    options.classGiven = app.count("--class") > 0;
    // A folder is for all that is found.
    if (!options.maildir.empty() && app.count("--limit") == 0) options.limit = 0;
    if (app.get_subcommands().empty()) options.command = Command::screen;
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
  if (completion->parsed()) {
    status = showCompletion(app, shell);
    return std::nullopt;
  }
  if (const char* const misused = misuse(options)) {
    std::cerr << "tallow: " << misused << '\n';
    status = ExitStatus::failure;
    return std::nullopt;
  }
  if (options.runtimeDirectory.empty()) {
    options.runtimeDirectory = rpc::defaultRuntimeDirectory();
  }
  return options;
}

}  // namespace cli
