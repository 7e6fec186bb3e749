#pragma once

#include <map>
#include <optional>
#include <string>

namespace cli {

// The results that the last search in a terminal showed, so that `tallow show 3` can find the third
// one. Stored in a small file for each terminal, in the user's runtime directory, which is removed
// after the last logout, or else in the state directory.
//
// A terminal is identified by its session: the ID and start time of the session leader. Without a
// terminal nothing is stored, unless $TALLOW_SESSION names a session.
struct LastSearch {
  std::string words;                           // to mark in the results
  std::map<size_t, std::string> results = {};  // identifiers by rank

  // Further results are not stored.
  static constexpr size_t kMaxResults = 10000;
};

// The number of terminals whose last search is kept; the oldest are removed.
inline constexpr size_t kMaxSessions = 64;

// If the search cannot be stored, it is dropped without an error.
void keepLastSearch(const LastSearch& search);

// Nullopt if there was no search.
[[nodiscard]] std::optional<LastSearch> lastSearch();

}  // namespace cli
