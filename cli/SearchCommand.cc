#include <fmt/format.h>
#include <unistd.h>

#include <algorithm>
#include <memory>
#include <nlohmann/json.hpp>
#include <span>
#include <utility>

#include "cli/Commands.h"
#include "cli/Explanation.h"
#include "cli/QueryInput.h"
#include "cli/Results.h"
#include "cli/SearchRun.h"
#include "cli/SyncCommand.h"
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

// By the catalogue of `tallow sync`, which is opened when the first such message is met.
MailReader::OffsetOf offsetsOfSync(const Options& options) {
  struct Opened {
    bool tried = false;
    std::unique_ptr<mailsync::Catalogue> catalogue;
  };
  return [opened = std::make_shared<Opened>(), settings = syncSettings(options)](
             const std::string& identifier) -> std::optional<uint64_t> {
    if (!std::exchange(opened->tried, true)) {
      opened->catalogue = mailsync::openCatalogue(settings, nullptr);
    }
    if (opened->catalogue == nullptr) return std::nullopt;
    const auto place = opened->catalogue->find(identifier);
    if (!place || !place->offset) return std::nullopt;
    return static_cast<uint64_t>(*place->offset);
  };
}

// What has been found, with what is known of it.
struct Outcome {
  Hits hits;
  ResultItems items;
  bool complete = true;
  std::vector<client::ReplacedWord> replaced;
};

void remarkOn(const SearchResults& found, size_t wanted, const MailFacts& facts) {
  if (facts.unreadable() > 0) {
    complain(fmt::format("{} messages cannot be read to look for what the index does not hold",
                         facts.unreadable()));
  }
  if (!found.complete && found.items.size() < wanted) {
    complain(fmt::format("only the first {} that may match were looked at", found.lookedAt));
  }
}

// Asks for more as long as copies of messages leave fewer results than are wanted.
std::optional<Outcome> search(const Options& options, const QueryInput& input, MailFacts& facts,
                              TLErrorOut error) {
  constexpr size_t kCounted = 1000;
  // Copies of the last message shown rank directly after it.
  constexpr size_t kCopies = 30;
  client::SearchServiceProxy service(options.runtimeDirectory, options.patience());
  const size_t limit = static_cast<size_t>(options.limit);
  const size_t shown =
      limit == 0 || options.count ? SIZE_MAX : limit + static_cast<size_t>(options.offset);
  size_t wanted = shown > SIZE_MAX - kCopies ? SIZE_MAX : shown + kCopies;
  if (options.format == OutputFormat::json) wanted = std::max(wanted, kCounted);
  for (;;) {
    auto found = runPlan(input.plan, {options.protectionClass, options.sort, wanted, options.count},
                         service, facts, error);
    if (!found) return std::nullopt;
    const bool all = found->complete || found->items.size() < wanted;
    if (all || wanted == SIZE_MAX) remarkOn(*found, wanted, facts);
    Hits hits = joinCopies(found->items, facts);
    if (all || hits.size() >= shown || wanted > SIZE_MAX / 4) {
      return Outcome{std::move(hits), std::move(found->items), found->complete,
                     std::move(found->replaced)};
    }
    wanted *= 4;
  }
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

}  // namespace

ExitStatus runSearch(const Options& options) {
  const auto input = readQuery(options);
  if (!input) return ExitStatus::failure;
  std::optional<TLError> error;
  MailFacts facts(offsetsOfSync(options));
  const auto outcome = search(options, *input, facts, &error);
  if (!outcome) return complain(error);
  if (outcome->items.empty()) {
    const bool useless = !options.query.empty() && termsOf(input->plan).empty();
    complain(std::string(useless ? "nothing in the expression can be looked up; see tallow-query(7)"
                                 : "no match"));
  }
  if (!outcome->replaced.empty()) complain(replacedText(outcome->replaced));
  if (options.count && options.format != OutputFormat::json) {
    return print(fmt::format("{}\n", outcome->hits.size()), statusOf(outcome->items));
  }
  std::span<const Hit> hits = outcome->hits;
  hits = hits.subspan(std::min(hits.size(), static_cast<size_t>(options.offset)));
  const auto limit = static_cast<size_t>(options.limit);
  if (options.count) hits = {};
  if (limit != 0) hits = hits.first(std::min(hits.size(), limit));
  const Page page{hits, static_cast<size_t>(options.offset) + 1, outcome->hits.size(),
                  outcome->complete, outcome->replaced};
  return print(outputOf(options, *input, page, facts), statusOf(outcome->items));
}

// How the query is understood does not need the daemon, and is shown without it as well.
ExitStatus runExplain(const Options& options) {
  const auto input = readQuery(options);
  if (!input) return ExitStatus::failure;
  const std::vector<TALTerm> terms = termsOf(input->plan);
  std::optional<TLError> error;
  MailFacts facts(offsetsOfSync(options));
  const auto outcome = search(options, *input, facts, &error);
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
