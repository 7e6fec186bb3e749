#pragma once

#include <functional>
#include <optional>
#include <stop_token>

#include "cli/MailFacts.h"
#include "cli/Options.h"
#include "client/SearchServiceProxy.h"
#include "screen/LatestWorker.h"
#include "screen/Search.h"

namespace cli {
struct Outcome;
struct QueryInput;
}  // namespace cli

namespace mailscreen {

// Searches on a thread of its own ("tallow.searcher") over a connection of its own. `wake` is
// called there when there is something to take. One thread uses it; no call waits, but for the
// destructor, which ends the call in hand.
class Searcher {
 public:
  // Runtime directory, class and name of the options count.
  Searcher(const cli::Options& options, std::function<void()> wake);
  ~Searcher() { _service.interrupt(); }
  Searcher(const Searcher&) = delete;
  Searcher& operator=(const Searcher&) = delete;

  void submit(Search search) { _worker.submit(std::move(search)); }
  [[nodiscard]] std::optional<Found> take() { return _worker.take(); }

 private:
  // On the worker's thread, as are those below.
  Found run(const Search& search, const std::stop_token& stop);
  void searchFor(const cli::QueryInput& input, const cli::Options& options,
                 const std::stop_token& stop, Found& found);
  void addRows(const cli::Outcome& outcome, Found& found);
  void addThreads(cli::Outcome& outcome, Found& found);
  Row rowOf(const TLIndexableItem& item, const std::vector<std::string>& words);

  const cli::Options _options;
  client::SearchServiceProxy _service;
  cli::MailFacts _facts;
  LatestWorker<Search, Found> _worker;  // the last, so that its thread ends before what it uses
};

}  // namespace mailscreen
