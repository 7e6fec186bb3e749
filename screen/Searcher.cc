#include "screen/Searcher.h"

#include <fmt/format.h>

#include <algorithm>
#include <span>

#include "cli/ErrorText.h"
#include "cli/Highlight.h"
#include "cli/HitSearch.h"
#include "cli/MailPlaces.h"
#include "cli/QueryInput.h"
#include "cli/Results.h"
#include "cli/SavedSearches.h"
#include "cli/StateDirectory.h"
#include "cli/Threads.h"
#include "platform/Clock.h"

namespace mailscreen {

namespace {

std::string joined(const std::vector<std::string>& remarks) {
  return fmt::format("{}", fmt::join(remarks, "; "));
}

void fail(Found& found, Failure failure, std::string reason) {
  found.failure = failure;
  found.reason = std::move(reason);
}

// The part of a list from `offset` on, if the list is that long.
template <typename T>
std::span<const T> pageOf(const std::vector<T>& all, const Search& search) {
  const auto rest = std::span(all).subspan(std::min(all.size(), search.offset));
  return rest.first(std::min(rest.size(), search.limit));
}

}  // namespace

Searcher::Searcher(const cli::Options& options, std::function<void()> wake)
    : _options(options),
      _service(options.runtimeDirectory),
      _facts(cli::offsetsOfSync(options)),
      _worker(
          "tallow.searcher",
          [this](const Search& search, const std::stop_token& stop) { return run(search, stop); },
          std::move(wake)) {}

Found Searcher::run(const Search& search, const std::stop_token& stop) {
  Found found{search};
  cli::Options options = _options;
  options.arguments = cli::argumentsOf(search.words);
  options.folder = search.folder;
  options.sort = search.order;
  options.threads = search.threads;
  options.limit = static_cast<int64_t>(search.limit);
  options.offset = static_cast<int64_t>(search.offset);
  std::optional<TLError> error;
  std::optional<cli::QueryInput> input;
  if (cli::expandSavedSearches(options.arguments, &error)) {
    input = cli::queryInput(options, platform::secondsSince1970(), &error);
  }
  if (!input) {
    fail(found, Failure::query, error->message);
  } else if (cli::isUnknownClass(options)) {
    fail(found, Failure::refused, cli::unknownClassText(options));
  } else {
    searchFor(*input, options, stop, found);
  }
  return found;
}

void Searcher::searchFor(const cli::QueryInput& input, const cli::Options& options,
                         const std::stop_token& stop, Found& found) {
  _facts.reader().refresh();
  found.words = cli::queryWords(input.markedWords());
  std::optional<TLError> error;
  auto outcome = cli::findHits(options, input.plan, _service, _facts, &error, stop);
  if (!outcome && rpc::isUnreachable(error)) {
    // The daemon may have been restarted.
    outcome = cli::findHits(options, input.plan, _service, _facts, &error, stop);
  }
  if (!outcome && rpc::isUnreachable(error)) {
    fail(found, Failure::unreachable, "tallowsearchd is not running");
  } else if (!outcome) {
    fail(found, Failure::refused, cli::plainText(*error));
  } else {
    found.remark = joined(input.remarks);
    if (!outcome->replaced.empty()) found.remark = cli::replacedText(outcome->replaced);
    found.complete = outcome->complete;
    options.threads ? addThreads(*outcome, found) : addRows(*outcome, found);
  }
}

void Searcher::addRows(const cli::Outcome& outcome, Found& found) {
  found.total = outcome.hits.size();
  for (const cli::Hit& hit : pageOf(outcome.hits, found.search)) {
    found.rows.push_back(rowOf(*hit.item, found.words));
  }
}

void Searcher::addThreads(cli::Outcome& outcome, Found& found) {
  cli::Hits& hits = outcome.hits;
  found.complete = found.complete && hits.size() <= cli::kMaxThreadedHits;
  hits.resize(std::min(hits.size(), cli::kMaxThreadedHits));
  const std::vector<cli::Thread> threads = cli::threadsOf(hits, _facts);
  found.total = threads.size();
  for (const cli::Thread& thread : pageOf(threads, found.search)) {
    for (const size_t hit : thread) {
      Row row = rowOf(*hits[hit].item, found.words);
      row.follows = hit != thread.front();
      if (!row.follows) row.together = thread.size();
      found.rows.push_back(std::move(row));
    }
  }
}

Row Searcher::rowOf(const TLIndexableItem& item, const std::vector<std::string>& words) {
  const cli::Palette marks = markingPalette();
  const auto clean = [](const std::string& text) {
    return cli::fitted(cli::cleanForTerminal(text), kMaxRowColumns);
  };
  Row row;
  row.identifier = platform::toUTF8(platform::orEmpty(item.identifier()));
  auto location = cli::parseIdentifier(row.identifier);
  if (location && location->message) {
    if (const auto known = _facts.reader().locate(row.identifier)) location = known;
  }
  if (location) row.path = location->path;
  row.place = location ? row.path : row.identifier;
  if (location && location->offset) row.place += fmt::format(":{}", *location->offset);
  row.folder = clean(cli::folderName(item));
  row.date = glyphsOf(cli::dateText(item));
  row.from = glyphsOf(clean(cli::authorsText(item)));
  const std::string subject = clean(cli::subjectText(item));
  row.subject = glyphsOf(subject.empty() ? "(no subject)"
                                         : cli::highlight(subject, words, marks.match, marks.end));
  return row;
}

}  // namespace mailscreen
