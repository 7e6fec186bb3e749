#pragma once

#include <functional>
#include <optional>
#include <stop_token>

#include "cli/MailFacts.h"
#include "cli/Options.h"
#include "client/SearchServiceProxy.h"
#include "platform/LatestWorker.h"
#include "screen/Search.h"

namespace cli {
struct Outcome;
struct QueryInput;
}  // namespace cli

namespace mailscreen {

// Searches on its own thread ("tallow.searcher") and connection. `wake` is called on that thread
// when a result is ready. Used by one thread. No call waits, except the destructor, which
// interrupts the current call.
class Searcher {
 public:
  // Uses the runtime directory, class and name of the options.
  Searcher(const cli::Options& options, std::function<void()> wake);
  ~Searcher() { _service.interrupt(); }
  Searcher(const Searcher&) = delete;
  Searcher& operator=(const Searcher&) = delete;

  void submit(Search search) { _worker.submit(std::move(search)); }
  [[nodiscard]] std::optional<Found> take() { return _worker.take(); }

 private:
  // Runs on the worker's thread, like the following functions.
  Found run(const Search& search, const std::stop_token& stop);
  void searchFor(const cli::QueryInput& input, const cli::Options& options,
                 const std::stop_token& stop, Found& found);
  void addRows(const cli::Outcome& outcome, Found& found);
  void addThreads(cli::Outcome& outcome, Found& found);
  Row rowOf(const TLIndexableItem& item, const std::vector<std::string>& words);

  const cli::Options _options;
  client::SearchServiceProxy _service;
  cli::MailFacts _facts;
  platform::LatestWorker<Search, Found> _worker;  // last member: its thread uses the others
};

}  // namespace mailscreen
