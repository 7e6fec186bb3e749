#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/TLError.h"

// Searches that the user has saved under a name, in the text file $XDG_CONFIG_HOME/tallow/searches,
// one "NAME WORDS" per line. The file may be edited: lines that are empty or begin with # are kept.
namespace cli {

struct SavedSearch {
  std::string name;   // empty if the line is not a search
  std::string words;  // the line itself, if it is not a search
};
using SavedSearches = std::vector<SavedSearch>;

inline constexpr size_t kMaxSavedBytes = size_t{1} << 20;  // of the file
inline constexpr size_t kMaxSearchName = 64;

// Letters, digits, "-", "_" and "."; must not start with "-".
[[nodiscard]] bool isSearchName(std::string_view text);

// In the order of the file. Nullopt with an error if the file cannot be read.
[[nodiscard]] std::optional<SavedSearches> readSavedSearches(TLErrorOut error);
bool writeSavedSearches(const SavedSearches& searches, TLErrorOut error);

[[nodiscard]] SavedSearches::iterator findSearch(SavedSearches& searches, std::string_view name);

// Replaces each @NAME or -@NAME in a command line by the words of the search, in parentheses if
// there are other words. False with an error for an unknown name.
bool expandSavedSearches(std::vector<std::string>& arguments, TLErrorOut error);

}  // namespace cli
