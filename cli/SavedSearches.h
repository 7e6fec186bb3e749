#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/TLError.h"

// Searches that a person has given a name. They lie in $XDG_CONFIG_HOME/tallow/searches, a text
// with a line for each, NAME WORDS, which may be edited; lines that are empty or begin with # stay
// as they are.
namespace cli {

struct SavedSearch {
  std::string name;   // empty for a line that is none
  std::string words;  // or that line
};
using SavedSearches = std::vector<SavedSearch>;

inline constexpr size_t kMaxSavedBytes = size_t{1} << 20;  // of the file
inline constexpr size_t kMaxSearchName = 64;

// Letters, digits, "-", "_" and "."; the first is no "-".
[[nodiscard]] bool isSearchName(std::string_view text);

// In the order of the file. None, with an error, where it cannot be read.
[[nodiscard]] std::optional<SavedSearches> readSavedSearches(TLErrorOut error);
bool writeSavedSearches(const SavedSearches& searches, TLErrorOut error);

[[nodiscard]] SavedSearches::iterator findSearch(SavedSearches& searches, std::string_view name);

// Puts the words of the search in place of each @NAME, or -@NAME, of a command line; beside other
// words they stand in parentheses. False, with an error, for a name that is not there.
bool expandSavedSearches(std::vector<std::string>& arguments, TLErrorOut error);

}  // namespace cli
