#pragma once

#include <map>
#include <optional>
#include <string>

namespace cli {

// What the last search of a terminal showed, so that `tallow show 3` knows what the third result
// is. It lies in a small file for each terminal, in the runtime directory of the user, which is
// gone after the last logout, else in the state directory.
//
// A terminal is known by its session: the process that leads it, and when that began. Where there
// is no terminal there is nothing to remember, unless $TALLOW_SESSION names a session.
struct LastSearch {
  std::string words;                           // to be marked in the results
  std::map<size_t, std::string> results = {};  // identifiers by rank

  // More than so many results are not kept.
  static constexpr size_t kMaxResults = 10000;
};

// Of so many terminals the last search is kept; then those of the oldest go.
inline constexpr size_t kMaxSessions = 64;

// A search that cannot be kept is no failure of the search: it is forgotten.
void keepLastSearch(const LastSearch& search);

// None where there was no search.
[[nodiscard]] std::optional<LastSearch> lastSearch();

}  // namespace cli
