#include "cli/HitSearch.h"

#include <algorithm>

#include "cli/Threads.h"

namespace cli {

namespace {

// The number of results to request in order to show `shown`.
size_t wantedFor(const Options& options, size_t shown) {
  constexpr size_t kCounted = 1000;  // also for threads, unless more are shown
  // Copies of the last message shown rank directly after it.
  constexpr size_t kCopies = 30;
  if (options.threads) return std::clamp(shown, kCounted, kMaxThreadedHits);
  const size_t wanted = shown > SIZE_MAX - kCopies ? SIZE_MAX : shown + kCopies;
  return options.format == OutputFormat::json ? std::max(wanted, kCounted) : wanted;
}

}  // namespace

std::optional<Outcome> findHits(const Options& options, const SearchPlan& plan,
                                client::SearchServiceProxy& service, MailFacts& facts,
                                TLErrorOut error, const std::stop_token& stop) {
  const size_t limit = static_cast<size_t>(options.limit);
  const size_t shown =
      limit == 0 || options.count ? SIZE_MAX : limit + static_cast<size_t>(options.offset);
  for (size_t wanted = wantedFor(options, shown);; wanted *= 4) {
    auto found = runPlan(plan, {options.protectionClass, options.sort, wanted, options.count, stop},
                         service, facts, error);
    if (!found) return std::nullopt;
    const bool all = found->complete || found->items.size() < wanted;
    Outcome outcome{{}, std::move(found->items), found->complete, std::move(found->replaced)};
    if (all) outcome.unreadable = facts.unreadable();
    if (all && !outcome.complete) outcome.lookedAt = found->lookedAt;
    outcome.hits = joinCopies(outcome.items, facts);
    const bool enough = all || options.threads || outcome.hits.size() >= shown;
    if (enough || wanted > SIZE_MAX / 4) return outcome;
  }
}

}  // namespace cli
