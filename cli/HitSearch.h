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

// What has been found, with what is known of it.
struct Outcome {
  Hits hits;
  ResultItems items;
  bool complete = true;
  std::vector<client::ReplacedWord> replaced = {};
  // As many candidates were looked at where that is why there are fewer than were wanted, else 0.
  size_t lookedAt = 0;
  size_t unreadable = 0;  // messages that could not be read to check them
};

// Searches for as many results as the options ask for, and for more as long as copies of messages
// leave fewer. None, with the error, where the daemon answers with one, or after a stop.
[[nodiscard]] std::optional<Outcome> findHits(const Options& options, const SearchPlan& plan,
                                              client::SearchServiceProxy& service, MailFacts& facts,
                                              TLErrorOut error, const std::stop_token& stop = {});

}  // namespace cli
