#include <fmt/format.h>
#include <unistd.h>

#include <algorithm>
#include <nlohmann/json.hpp>
#include <numeric>
#include <span>
#include <utility>

#include "cli/Commands.h"
#include "cli/Explanation.h"
#include "cli/HitSearch.h"
#include "cli/LastSearch.h"
#include "cli/MailPlaces.h"
#include "cli/MaildirResults.h"
#include "cli/QueryInput.h"
#include "cli/Results.h"
#include "cli/SavedSearches.h"
#include "cli/StateDirectory.h"
#include "cli/Threads.h"
#include "client/SearchServiceProxy.h"
#include "platform/Clock.h"

namespace cli {

namespace {

std::optional<QueryInput> readQuery(Options options) {
  std::optional<TLError> error;
  if (!expandSavedSearches(options.arguments, &error)) {
    complain(error->message);
    return std::nullopt;
  }
  auto input = queryInput(options, platform::secondsSince1970(), &error);
  if (!input) {
    complain(error->message);
  } else {
    for (const std::string& remark : input->remarks) complain(remark);
  }
  return input;
}

void remarkOn(const Outcome& outcome) {
  if (outcome.unreadable > 0) {
    complain(fmt::format("{} messages cannot be read to look for what the index does not hold",
                         outcome.unreadable));
  }
  if (outcome.lookedAt > 0) {
    complain(fmt::format("only the first {} that may match were looked at", outcome.lookedAt));
  }
}

std::optional<Outcome> search(const Options& options, const QueryInput& input, MailFacts& facts,
                              TLErrorOut error) {
  client::SearchServiceProxy service(options.runtimeDirectory, options.patience());
  auto outcome = findHits(options, input.plan, service, facts, error);
  if (outcome) remarkOn(*outcome);
  return outcome;
}

// Stores the ranks for `tallow show`, if they are shown.
void keepRanks(const Options& options, const QueryInput& input, const Hits& hits,
               const std::vector<size_t>& shown) {
  const bool ranked = options.format == OutputFormat::text || options.format == OutputFormat::json;
  if (!ranked || options.count) return;
  LastSearch search{input.markedWords()};
  for (const size_t hit : shown) {
    search.results[hit + 1] = platform::toUTF8(platform::orEmpty(hits[hit].item->identifier()));
  }
  keepLastSearch(search);
}

ExitStatus statusOf(const ResultItems& items) {
  return items.empty() ? ExitStatus::nothingFound : ExitStatus::done;
}

std::string outputOf(const Options& options, const QueryInput& input, const Page& page,
                     MailFacts& facts) {
  switch (options.format) {
    case OutputFormat::json:
      return resultsJSON(page, facts);
    case OutputFormat::files:
      return resultsFiles(page, facts, options.print0);
    case OutputFormat::messageIDs:
      return resultsMessageIDs(page, facts, options.print0);
    case OutputFormat::text:
      break;
  }
  return resultsText(page, input.markedWords(), facts,
                     Palette(colorAllowed(options.color, STDOUT_FILENO)), columnsOf(STDOUT_FILENO));
}

ExitStatus printCount(size_t count) {
  return print(fmt::format("{}\n", count), count > 0 ? ExitStatus::done : ExitStatus::nothingFound);
}

// The part of a list that the options select.
template <typename T>
std::span<const T> pageOf(const Options& options, std::span<const T> all) {
  if (options.count) return {};
  all = all.subspan(std::min(all.size(), static_cast<size_t>(options.offset)));
  const auto limit = static_cast<size_t>(options.limit);
  return limit == 0 ? all : all.first(std::min(all.size(), limit));
}

ExitStatus showHits(const Options& options, const QueryInput& input, const Outcome& outcome,
                    MailFacts& facts) {
  const size_t total = outcome.hits.size();
  if (options.count && options.format != OutputFormat::json) return printCount(total);
  const auto hits = pageOf<Hit>(options, outcome.hits);
  const auto first = static_cast<size_t>(options.offset);
  std::vector<size_t> shown(hits.size());
  std::iota(shown.begin(), shown.end(), first);
  keepRanks(options, input, outcome.hits, shown);
  return print(
      outputOf(options, input, {hits, first + 1, total, outcome.complete, outcome.replaced}, facts),
      statusOf(outcome.items));
}

ExitStatus showThreads(const Options& options, const QueryInput& input, Outcome& outcome,
                       MailFacts& facts) {
  Hits& all = outcome.hits;
  if (all.size() > kMaxThreadedHits) {
    all.resize(kMaxThreadedHits);
    outcome.complete = false;
  }
  if (!outcome.complete) {
    complain(fmt::format("only the first {} results are put into threads", all.size()));
  }
  const std::vector<Thread> threads = threadsOf(all, facts);
  if (options.count && options.format != OutputFormat::json) return printCount(threads.size());
  const auto shown = pageOf<Thread>(options, threads);
  const ThreadPage page{all, shown, threads.size(), outcome.complete};
  std::vector<size_t> ranks;
  for (const Thread& thread : shown) ranks.insert(ranks.end(), thread.begin(), thread.end());
  keepRanks(options, input, all, ranks);
  const ExitStatus status = statusOf(outcome.items);
  if (options.format == OutputFormat::json) return print(threadsJSON(page, facts), status);
  if (options.format == OutputFormat::text) {
    return print(
        threadsText(page, input.markedWords(), Palette(colorAllowed(options.color, STDOUT_FILENO)),
                    columnsOf(STDOUT_FILENO)),
        status);
  }
  // As a list of files or Message-IDs, thread by thread.
  Hits ordered;
  for (const size_t hit : ranks) ordered.push_back(all[hit]);
  return print(outputOf(options, input,
                        {ordered, 1, ordered.size(), outcome.complete, outcome.replaced}, facts),
               status);
}

}  // namespace

ExitStatus runSearch(const Options& options) {
  if (emptiesMaildir(options)) return emptyMaildir(options);
  const auto input = readQuery(options);
  if (!input) return ExitStatus::failure;
  std::optional<TLError> error;
  MailFacts facts(offsetsOfSync(options));
  if (isUnknownClass(options)) return complainOfUnknownClass(options);
  auto outcome = search(options, *input, facts, &error);
  if (!outcome) return complain(error);
  if (outcome->items.empty()) {
    const bool useless = !options.query.empty() && termsOf(input->plan).empty();
    complain(std::string(useless ? "nothing in the expression can be looked up; see tallow-query(7)"
                                 : "no match"));
  }
  if (!outcome->replaced.empty()) complain(replacedText(outcome->replaced));
  if (!options.maildir.empty()) {
    return showMaildir(options, pageOf<Hit>(options, outcome->hits), facts);
  }
  return options.threads ? showThreads(options, *input, *outcome, facts)
                         : showHits(options, *input, *outcome, facts);
}

// The interpretation of the query does not need the daemon, so it is shown even without one.
ExitStatus runExplain(const Options& options) {
  const auto input = readQuery(options);
  if (!input) return ExitStatus::failure;
  const std::vector<TALTerm> terms = termsOf(input->plan);
  std::optional<TLError> error;
  MailFacts facts(offsetsOfSync(options));
  const bool unknown = isUnknownClass(options);
  const auto outcome = unknown ? Outcome() : search(options, *input, facts, &error);
  if (unknown) (void)complainOfUnknownClass(options);
  if (outcome && outcome->items.empty() && !options.query.empty() && terms.empty()) {
    complain(std::string("nothing in the expression can be looked up; see tallow-query(7)"));
  }
  ResultItems items;
  if (outcome) items = outcome->items;
  if (options.limit != 0) items.resize(std::min(items.size(), static_cast<size_t>(options.limit)));
  const Palette palette(colorAllowed(options.color, STDOUT_FILENO));
  std::string output;
  if (options.format == OutputFormat::json) {
    nlohmann::json json = explanationJSON(*input, terms);
    json["results"] = outcome ? scoresJSON(items) : nlohmann::json();
    output = jsonText(json);
  } else {
    output = explanationText(*input, terms, palette);
    if (outcome) output += scoresText(items, palette);
  }
  const ExitStatus written = print(output, outcome ? statusOf(items) : ExitStatus::failure);
  return outcome ? written : complain(error);
}

}  // namespace cli
