#pragma once

#include <stop_token>
#include <string>
#include <vector>

#include "cli/MailDate.h"
#include "cli/MailFacts.h"
#include "cli/Results.h"
#include "cli/SearchPlan.h"
#include "client/SearchServiceProxy.h"

namespace cli {

// Requirements of a search in addition to its plan.
struct SearchRequest {
  std::string protectionClass;
  SortOrder order = SortOrder::relevance;
  size_t wanted = 20;         // number of results needed; SIZE_MAX for all
  bool complete = false;      // all results must be found regardless of `wanted`, to be counted
  std::stop_token stop = {};  // the results are no longer wanted
};

struct SearchResults {
  ResultItems items;
  // False if there may be more results: the daemon has more candidates than were checked.
  bool complete = true;
  // The number of candidates requested, if not `complete`.
  size_t lookedAt = 0;
  // The words that the daemon replaced to find these items.
  std::vector<client::ReplacedWord> replaced;
};

// Numbers of candidates to request, increased when there are too few results.
inline constexpr size_t kCandidateSteps[] = {1000, 10000, 100000};

// Runs a plan: requests the candidates of each branch, removes the exclusions, merges the branches
// by identifier, and checks the candidates in order until there are enough results. Nullopt with an
// error from the daemon, or with one of ours after a stop.
[[nodiscard]] std::optional<SearchResults> runPlan(const SearchPlan& plan,
                                                   const SearchRequest& request,
                                                   client::SearchServiceProxy& service,
                                                   MailFacts& facts, TLErrorOut error);

}  // namespace cli
