#include "cli/Commands.h"

#include <fmt/format.h>
#include <unistd.h>

#include <cstdio>
#include <iostream>
#include <nlohmann/json.hpp>

#include "cli/ErrorText.h"
#include "cli/Results.h"
#include "client/DebugServiceProxy.h"
#include "client/SearchServiceProxy.h"
#include "records/TLDebugServiceKeys.h"

namespace cli {

namespace {

using Run = ExitStatus (*)(const Options&);

std::string withLineFeed(std::string text) {
  if (text.empty() || text.back() != '\n') text.push_back('\n');
  return text;
}

bool confirmed(const Options& options) {
  if (options.yes) return true;
  if (isatty(STDIN_FILENO) != 1 || isatty(STDERR_FILENO) != 1) {
    complain("reset without a terminal needs --yes");
    return false;
  }
  fmt::print(stderr, "Delete everything that is indexed for class \"{}\"? [y/N] ",
             cleanForTerminal(options.protectionClass));
  std::string answer;
  std::getline(std::cin, answer);
  if (answer == "y" || answer == "Y" || answer == "yes") return true;
  complain("nothing has been deleted");
  return false;
}

ExitStatus runReset(const Options& options) {
  if (!confirmed(options)) return ExitStatus::failure;
  std::optional<TLError> error;
  client::SearchServiceProxy service(options.runtimeDirectory, options.patience());
  if (!service.deleteAllItems(options.name, options.protectionClass, &error)) {
    return complain(error);
  }
  return print(options.format == OutputFormat::json ? jsonText({{"reset", true}})
                                                    : "The index is empty.\n");
}

ExitStatus runStats(const Options& options) {
  std::optional<TLError> error;
  client::DebugServiceProxy service(options.runtimeDirectory, options.patience());
  const auto statistics =
      service.fetchStatsForIndexer(options.name, options.protectionClass, &error);
  if (!statistics) return complain(error);
  nlohmann::ordered_json json = nlohmann::ordered_json::object();
  std::string text;
  int64_t unsearchable = 0;
  for (const auto& [key, value] : *statistics) {
    const auto number = std::visit([](auto v) { return nlohmann::ordered_json(v); }, value);
    json[key] = number;
    text += fmt::format("{:50} {:>14}\n", cleanForTerminal(key), number.dump());
    const int64_t* const count = std::get_if<int64_t>(&value);
    if (count == nullptr) continue;
    if (key == TLDebugServiceDocStoreNumOfItems) unsearchable += *count;
    if (key == TLDebugServiceTextStoreNumOfItems) unsearchable -= *count;
  }
  // From a batch that was never acknowledged, for example because the daemon was killed.
  if (unsearchable > 0) {
    text += fmt::format("{} stored and not searchable: index the mail again\n", unsearchable);
  }
  return print(options.format == OutputFormat::json ? escapeJSONForTerminal(json.dump(2)) + '\n'
                                                    : text);
}

// Prints a text from the daemon, as it is or as the value of one JSON key.
ExitStatus printText(const Options& options, const char* key,
                     const std::optional<std::string>& text, const std::optional<TLError>& error) {
  if (!text) return complain(error);
  return print(options.format == OutputFormat::json ? jsonText({{key, *text}})
                                                    : withLineFeed(cleanLinesForTerminal(*text)));
}

ExitStatus runMetrics(const Options& options) {
  std::optional<TLError> error;
  client::DebugServiceProxy service(options.runtimeDirectory, options.patience());
  const auto text = service.fetchStatsForSalt(options.name, options.protectionClass, &error);
  return printText(options, "metrics", text, error);
}

ExitStatus runPing(const Options& options) {
  std::optional<TLError> error;
  client::DebugServiceProxy service(options.runtimeDirectory, options.patience());
  const auto text =
      service.ping(options.arguments.empty() ? "tallow" : options.arguments[0], &error);
  return printText(options, "ping", text, error);
}

ExitStatus runVacuum(const Options& options) {
  std::optional<TLError> error;
  client::DebugServiceProxy service(options.runtimeDirectory, options.patience());
  if (!service.forceVacuumAndCompact(options.protectionClass, &error)) return complain(error);
  return print(options.format == OutputFormat::json ? jsonText({{"vacuum", true}})
                                                    : "The index has been compacted.\n");
}

ExitStatus runState(const Options& options) {
  std::optional<TLError> error;
  client::SearchServiceProxy service(options.runtimeDirectory, options.patience());
  const auto state = service.fetchLastClientState(options.name, options.protectionClass, &error);
  if (error) return complain(error);
  std::string hex;
  for (const char c : state.value_or("")) {
    hex += fmt::format("{:02x}", static_cast<unsigned char>(c));
  }
  const bool printable =
      state && platform::isValidUTF8(*state) && cleanForTerminal(*state) == *state;
  if (options.format == OutputFormat::json) {
    nlohmann::json json{{"name", options.name}, {"present", state.has_value()}};
    if (state) json["hex"] = hex;
    if (printable) json["text"] = *state;
    return print(jsonText(json), state ? ExitStatus::done : ExitStatus::nothingFound);
  }
  if (!state) {
    complain(fmt::format("no state is stored under the name {}", options.name));
    return ExitStatus::nothingFound;
  }
  return print(fmt::format("{}\n{}", hex, printable ? *state + '\n' : std::string()));
}

struct CommandFunction {
  Command command;
  Run run;
};

constexpr CommandFunction kFunctions[] = {
    {Command::index, runIndex},     {Command::sync, runSync},
    {Command::watch, runWatch},     {Command::status, runStatus},
    {Command::search, runSearch},   {Command::explain, runExplain},
    {Command::show, runShow},       {Command::address, runAddress},
    {Command::save, runSave},       {Command::remove, runDelete},
    {Command::reset, runReset},     {Command::stats, runStats},
    {Command::metrics, runMetrics}, {Command::ping, runPing},
    {Command::vacuum, runVacuum},   {Command::state, runState},
    {Command::dump, runDump},       {Command::validate, runValidate},
    {Command::purge, runPurge},     {Command::setup, runSetup},
};

}  // namespace

ExitStatus print(std::string_view text, ExitStatus status) {
  const bool written =
      std::fwrite(text.data(), 1, text.size(), stdout) == text.size() && std::fflush(stdout) == 0;
  return written ? status : ExitStatus::failure;
}

void complain(const std::string& message) {
  fmt::print(stderr, "tallow: {}\n", cleanForTerminal(message));
}

ExitStatus complain(const std::optional<TLError>& error) {
  if (!error) {
    complain(std::string("the daemon gave no answer"));
    return ExitStatus::failure;
  }
  const bool unreachable = rpc::isUnreachable(error);
  complain(plainText(*error));
  if (unreachable) {
    complain(
        std::string("is tallowsearchd running? \"systemctl --user start "
                    "tallowsearchd.socket\" starts it, --wait 10 waits for it"));
  }
  return unreachable ? ExitStatus::unreachable : ExitStatus::failure;
}

ExitStatus runCommand(const Options& options) {
  for (const CommandFunction& function : kFunctions) {
    if (function.command == options.command) return function.run(options);
  }
  return ExitStatus::failure;
}

}  // namespace cli
