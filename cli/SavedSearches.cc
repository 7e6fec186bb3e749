#include "cli/SavedSearches.h"

#include <fmt/format.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>

#include "platform/Files.h"
#include "platform/Paths.h"

namespace cli {

namespace {

std::string directory() {
  const char* const config = std::getenv("XDG_CONFIG_HOME");
  if (config != nullptr && *config == '/') return platform::joinPath(config, "tallow");
  const char* const home = std::getenv("HOME");
  return platform::joinPath(home == nullptr ? "/" : home, ".config/tallow");
}

std::string path() {
  return platform::joinPath(directory(), "searches");
}

// The name in @NAME or -@NAME; empty for another argument.
std::string_view nameIn(std::string_view argument) {
  if (argument.starts_with('-')) argument.remove_prefix(1);
  if (!argument.starts_with('@') || !isSearchName(argument.substr(1))) return {};
  return argument.substr(1);
}

SavedSearch searchOf(const std::string& line) {
  const size_t space = line.find(' ');
  const bool search = space != std::string::npos && isSearchName(line.substr(0, space));
  return search ? SavedSearch{line.substr(0, space), line.substr(space + 1)}
                : SavedSearch{"", line};
}

}  // namespace

bool isSearchName(std::string_view text) {
  constexpr std::string_view kLetters =
      "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789-_.";
  return !text.empty() && text.size() <= kMaxSearchName && text[0] != '-' &&
         text.find_first_not_of(kLetters) == std::string_view::npos;
}

std::optional<SavedSearches> readSavedSearches(TLErrorOut error) {
  std::optional<TLError> failure;
  const auto text = platform::readFile(path(), kMaxSavedBytes, &failure);
  SavedSearches searches;
  if (!text && failure->code == ENOENT) return searches;
  if (!text) {
    platform::setError(error, *failure);
    return std::nullopt;
  }
  for (size_t at = 0; at < text->size();) {
    const size_t end = std::min(text->find('\n', at), text->size());
    searches.push_back(searchOf(text->substr(at, end - at)));
    at = end + 1;
  }
  return searches;
}

bool writeSavedSearches(const SavedSearches& searches, TLErrorOut error) {
  std::string text;
  for (const auto& [name, words] : searches) {
    text += name.empty() ? words : name + ' ' + words;
    text += '\n';
  }
  if (text.size() > kMaxSavedBytes) {
    platform::setError(error, platform::posixError(EFBIG, path()));
    return false;
  }
  return platform::createDirectories(directory(), error) &&
         platform::writeFileAtomically(path(), text, error);
}

SavedSearches::iterator findSearch(SavedSearches& searches, std::string_view name) {
  return std::find_if(searches.begin(), searches.end(),
                      [name](const SavedSearch& search) { return search.name == name; });
}

bool expandSavedSearches(std::vector<std::string>& arguments, TLErrorOut error) {
  const bool none = std::all_of(arguments.begin(), arguments.end(),
                                [](const std::string& text) { return nameIn(text).empty(); });
  if (none) return true;
  auto searches = readSavedSearches(error);
  if (!searches) return false;
  const bool alone = arguments.size() == 1;
  for (std::string& argument : arguments) {
    const std::string_view name = nameIn(argument);
    if (name.empty()) continue;
    const auto found = findSearch(*searches, name);
    if (found == searches->end()) {
      platform::setError(
          error, {"tallow", ENOENT,
                  fmt::format("there is no saved search \"{0}\"; `tallow save` lists them, and to "
                              "look for the word, leave out the @",
                              name)});
      return false;
    }
    const bool negated = argument.starts_with('-');
    argument =
        alone && !negated ? found->words : fmt::format("{}({})", negated ? "-" : "", found->words);
  }
  return true;
}

}  // namespace cli
