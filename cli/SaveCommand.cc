#include <fmt/format.h>

#include <algorithm>
#include <nlohmann/json.hpp>
#include <span>

#include "cli/Commands.h"
#include "cli/Results.h"
#include "cli/SavedSearches.h"
#include "platform/Clock.h"
#include "usersyntax/Syntax.h"

namespace cli {

namespace {

// The name of a search, given with or without "@".
std::string nameOf(const std::string& argument) {
  return argument.starts_with('@') ? argument.substr(1) : argument;
}

ExitStatus unknown(const std::string& name) {
  complain(fmt::format("there is no saved search \"{}\"", name));
  return ExitStatus::nothingFound;
}

ExitStatus list(const Options& options, const SavedSearches& searches) {
  nlohmann::json json = nlohmann::json::array();
  std::string text;
  for (const auto& [name, words] : searches) {
    if (name.empty()) continue;
    json.push_back({{"name", name}, {"words", words}});
    text += fmt::format("{:16} {}\n", name, cleanForTerminal(words));
  }
  if (json.empty()) complain(std::string("no search is saved; `tallow save NAME WORDS` does that"));
  return print(options.format == OutputFormat::json ? jsonText(json) : text,
               json.empty() ? ExitStatus::nothingFound : ExitStatus::done);
}

ExitStatus write(const SavedSearches& searches) {
  std::optional<TLError> error;
  return writeSavedSearches(searches, &error) ? ExitStatus::done : complain(error);
}

ExitStatus remove(const Options& options, SavedSearches& searches) {
  for (const std::string& argument : options.arguments) {
    const auto found = findSearch(searches, nameOf(argument));
    if (found == searches.end()) return unknown(nameOf(argument));
    searches.erase(found);
  }
  return write(searches);
}

ExitStatus save(const Options& options, SavedSearches& searches) {
  const std::string name = nameOf(options.arguments.front());
  if (!isSearchName(name)) {
    complain(
        fmt::format("\"{}\" cannot be a name: it has letters, digits, \"-\", \"_\" and \".\", "
                    "{} at most",
                    name, kMaxSearchName));
    return ExitStatus::failure;
  }
  const std::span<const std::string> rest = std::span(options.arguments).subspan(1);
  std::string words = fmt::format("{}", fmt::join(rest, " "));
  std::replace_if(
      words.begin(), words.end(), [](char c) { return c == '\n' || c == '\r'; }, ' ');
  for (const auto& remark : usersyntax::parse(words, platform::secondsSince1970()).remarks) {
    complain(remark);
  }
  const auto found = findSearch(searches, name);
  if (found != searches.end()) {
    found->words = words;
  } else {
    searches.push_back({name, words});
  }
  return write(searches);
}

}  // namespace

ExitStatus runSave(const Options& options) {
  std::optional<TLError> error;
  auto searches = readSavedSearches(&error);
  if (!searches) return complain(error);
  if (options.removeSaved) return remove(options, *searches);
  if (options.arguments.empty()) return list(options, *searches);
  if (options.arguments.size() > 1) return save(options, *searches);
  const auto found = findSearch(*searches, nameOf(options.arguments.front()));
  if (found == searches->end()) return unknown(nameOf(options.arguments.front()));
  return list(options, {*found});
}

}  // namespace cli
