#pragma once

#include <stop_token>
#include <string>
#include <vector>

#include "cli/MailFacts.h"
#include "cli/Results.h"
#include "cli/SearchPlan.h"
#include "client/SearchServiceProxy.h"

namespace cli {

// What is asked of a search beside its plan.
struct SearchRequest {
  std::string protectionClass;
  SortOrder order = SortOrder::relevance;
  size_t wanted = 20;     // results that are needed; SIZE_MAX for all
  bool complete = false;  // all have to be found, whatever is wanted, so that they can be counted
  std::stop_token stop = {};  // the results are wanted no more
};

struct SearchResults {
  ResultItems items;
  // False where there may be more: the daemon knows more candidates than were looked at.
  bool complete = true;
  // How many candidates were asked for where `complete` is false.
  size_t lookedAt = 0;
  // The words that the daemon replaced to find these items.
  std::vector<client::ReplacedWord> replaced;
};

// Candidates that are asked for, each time that those before were too few.
inline constexpr size_t kCandidateSteps[] = {1000, 10000, 100000};

// Carries out a plan: asks the daemon for the candidates of each branch, takes out what has to go,
// joins the branches by identifier, and checks the candidates in order until enough are found.
// None, with the error, where the daemon answers with one, or with one of ours after a stop.
[[nodiscard]] std::optional<SearchResults> runPlan(const SearchPlan& plan,
                                                   const SearchRequest& request,
                                                   client::SearchServiceProxy& service,
                                                   MailFacts& facts, TLErrorOut error);

// The date that an item is shown with, in seconds since 1970: of receipt, else of sending.
[[nodiscard]] std::optional<double> dateOf(const TLIndexableItem& item);

}  // namespace cli
