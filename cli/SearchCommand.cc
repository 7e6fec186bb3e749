#include <fmt/format.h>
#include <unistd.h>

#include <nlohmann/json.hpp>

#include "cli/Commands.h"
#include "cli/Explanation.h"
#include "cli/QueryInput.h"
#include "cli/Results.h"
#include "cli/SearchRun.h"
#include "client/SearchServiceProxy.h"
#include "platform/Clock.h"

namespace cli {

namespace {

std::optional<QueryInput> readQuery(const Options& options) {
  std::optional<TLError> error;
  auto input = queryInput(options, platform::secondsSince1970(), &error);
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
  MailFacts facts;
  const size_t wanted = options.limit == 0 ? SIZE_MAX : static_cast<size_t>(options.limit);
  auto found = runPlan(input.plan, {options.protectionClass, SortOrder::relevance, wanted, false},
                       service, facts, error);
  if (!found) return std::nullopt;
  if (found->items.empty() && !options.query.empty() && termsOf(input.plan).empty()) {
    complain(std::string("nothing in the expression can be looked up; see tallow-query(7)"));
  }
  if (facts.unreadable() > 0) {
    complain(fmt::format("{} messages cannot be read to look for what the index does not hold",
                         facts.unreadable()));
  }
  if (!found->complete && found->items.size() < wanted) {
    complain(fmt::format("only the first {} that may match were looked at", found->lookedAt));
  }
  return std::move(found->items);
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
  return print(resultsText(*items, input->markedWords(),
                           Palette(colorAllowed(options.color, STDOUT_FILENO))),
               statusOf(*items));
}

// How the query is understood does not need the daemon, and is shown without it as well.
ExitStatus runExplain(const Options& options) {
  const auto input = readQuery(options);
  if (!input) return ExitStatus::failure;
  const std::vector<TALTerm> terms = termsOf(input->plan);
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
