#pragma once

#include <optional>
#include <stop_token>
#include <vector>

#include "cli/MailFacts.h"
#include "cli/Options.h"
#include "cli/QueryInput.h"
#include "cli/Results.h"
#include "cli/SearchRun.h"
#include "client/SearchServiceProxy.h"

namespace cli {

// The hits of a search and what is known about their number.
struct Outcome {
  Hits hits;
  ResultItems items;
  bool complete = true;
  std::vector<client::ReplacedWord> replaced = {};
  // The number of candidates checked, if this limit is why there are fewer hits than requested;
  // otherwise 0.
  size_t lookedAt = 0;
  size_t unreadable = 0;  // messages that could not be read to check them
};

// Searches for the number of results that the options request, and for more while duplicates of
// messages leave too few. Nullopt with an error if the daemon fails or the search is stopped.
[[nodiscard]] std::optional<Outcome> findHits(const Options& options, const SearchPlan& plan,
                                              client::SearchServiceProxy& service, MailFacts& facts,
                                              TLErrorOut error, const std::stop_token& stop = {});

}  // namespace cli
