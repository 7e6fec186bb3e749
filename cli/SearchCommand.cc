#include <unistd.h>

#include <nlohmann/json.hpp>

#include "cli/Commands.h"
#include "cli/Explanation.h"
#include "cli/QueryInput.h"
#include "cli/Results.h"
#include "client/SearchServiceProxy.h"

namespace cli {

namespace {

// The daemon's answer to a query that makes no terms, such as the first quote mark of a phrase that
// is being typed: it finds nothing.
bool asksForNothing(const std::optional<TLError>& error) {
  constexpr int kNoTerms = 3;
  return error && error->domain == "TALIndexer" && error->code == kNoTerms;
}

std::optional<QueryInput> readQuery(const Options& options) {
  std::optional<TLError> error;
  auto input = queryInput(options, &error);
  if (!input) {
    complain(error->message);
  } else {
    for (const std::string& remark : input->remarks) complain(remark);
  }
  return input;
}

std::optional<ResultItems> search(const Options& options, const QueryInput& input,
                                  TLErrorOut error) {
  client::SearchServiceProxy service(options.runtimeDirectory, options.patience());
  const int64_t limit = options.limit == 0 ? service.kNoMaximum : options.limit;
  auto items = service.searchItems(*input.query, 0, options.protectionClass, limit, error);
  if (items || !asksForNothing(*error)) return items;
  if (input.words.empty()) {
    complain(std::string("nothing in the expression can be looked up; see tallow-query(7)"));
  }
  return ResultItems();
}

ExitStatus statusOf(const ResultItems& items) {
  return items.empty() ? ExitStatus::nothingFound : ExitStatus::done;
}

}  // namespace

ExitStatus runSearch(const Options& options) {
  const auto input = readQuery(options);
  if (!input) return ExitStatus::failure;
  std::optional<TLError> error;
  const auto items = search(options, *input, &error);
  if (!items) return complain(error);
  switch (options.format) {
    case OutputFormat::json:
      return print(resultsJSON(*items), statusOf(*items));
    case OutputFormat::files:
      return print(resultsFiles(*items), statusOf(*items));
    case OutputFormat::text:
      break;
  }
  const std::string text = platform::toUTF8(platform::orEmpty(input->query->originalQuery()));
  return print(resultsText(*items, text, Palette(colorAllowed(options.color, STDOUT_FILENO))),
               statusOf(*items));
}

// How the query is understood does not need the daemon, and is shown without it as well.
ExitStatus runExplain(const Options& options) {
  const auto input = readQuery(options);
  if (!input) return ExitStatus::failure;
  const std::vector<TALTerm> terms = termsOf(*input->query);
  std::optional<TLError> error;
  const auto items = search(options, *input, &error);
  const Palette palette(colorAllowed(options.color, STDOUT_FILENO));
  std::string output;
  if (options.format == OutputFormat::json) {
    nlohmann::json json = explanationJSON(*input, terms);
    json["results"] = items ? scoresJSON(*items) : nlohmann::json();
    output = jsonText(json);
  } else {
    output = explanationText(*input, terms, palette);
    if (items) output += scoresText(*items, palette);
  }
  const ExitStatus written = print(output, items ? statusOf(*items) : ExitStatus::failure);
  return items ? written : complain(error);
}

}  // namespace cli
