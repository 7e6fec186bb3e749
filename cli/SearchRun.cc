#include "cli/SearchRun.h"

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <unordered_map>
#include <unordered_set>

#include "cli/TextMatch.h"

namespace cli {

namespace {

using usersyntax::Field;
using usersyntax::Kind;

// The daemon's default number of candidates.
constexpr size_t kDaemonCandidates = 1000;

std::string identifierOf(const TLIndexableItem& item) {
  return platform::toUTF8(platform::orEmpty(item.identifier()));
}

// The daemon's error for a query without terms, such as a single quote mark at the start of a
// phrase; such a query has no results.
bool asksForNothing(const std::optional<TLError>& error) {
  constexpr int kNoTerms = 3;
  return error && error->domain == "TALIndexer" && error->code == kNoTerms;
}

struct Candidate {
  std::shared_ptr<TLIndexableItem> item;
  std::vector<const Branch*> branches;  // branches that found it
};

float scoreOf(const TLIndexableItem& item) {
  return item.hasCard() ? item.card()->lightScore() : 0.0F;
}

// The daemon's order: score, then date, then identifier, all descending.
bool ranksBefore(const Candidate& a, const Candidate& b) {
  const float left = scoreOf(*a.item);
  const float right = scoreOf(*b.item);
  if (left != right) return left > right;
  const double leftDate = dateOf(*a.item).value_or(0);
  const double rightDate = dateOf(*b.item).value_or(0);
  if (leftDate != rightDate) return leftDate > rightDate;
  return platform::orEmpty(a.item->identifier()) > platform::orEmpty(b.item->identifier());
}

bool isNewer(const Candidate& a, const Candidate& b) {
  return dateOf(*a.item).value_or(-HUGE_VAL) > dateOf(*b.item).value_or(-HUGE_VAL);
}

class Run {
 public:
  Run(const SearchPlan& plan, const SearchRequest& request, client::SearchServiceProxy& service,
      MailFacts& facts)
      : _plan(plan), _request(request), _service(service), _facts(facts) {}

  std::optional<SearchResults> run(TLErrorOut error) {
    for (const size_t step : kCandidateSteps) {
      _truncated = false;
      _replaced.clear();
      _step = step;
      auto candidates = gather(error);
      if (!candidates) return std::nullopt;
      if (_request.order == SortOrder::date) {
        std::stable_sort(candidates->begin(), candidates->end(), isNewer);
      }
      SearchResults results = check(*candidates);
      const bool enough = results.items.size() >= _request.wanted && !needsAll();
      const bool last = step == std::end(kCandidateSteps)[-1] || _fixed;
      if (!_truncated || enough || last) {
        results.complete = results.complete && !_truncated;
        results.lookedAt = _lookedAt;
        if (!results.items.empty()) results.replaced = _replaced;
        return results;
      }
    }
    return std::nullopt;
  }

 private:
  // A truncated list lacks the lowest scores, which may come first in another order.
  [[nodiscard]] bool needsAll() const {
    return _request.complete || _request.order != SortOrder::relevance;
  }

  std::optional<ResultItems> ask(const TLQuery& query, TLErrorOut error) {
    if (_request.stop.stop_requested()) {
      platform::setError(error, {"tallow", ECANCELED, "the search was given up"});
      return std::nullopt;
    }
    const auto sent = query.copyWithZone();
    // Plain words are sent as typed, unless more candidates are needed.
    const bool raised = !_plan.asTyped || needsAll();
    if (raised) addParameter(*sent, "salt.maxTopK", static_cast<int32_t>(_step));
    const auto limit = sent->hasSearchParams()
                           ? sent->searchParams()->parameterKeyValueForKey("salt.maxTopK")
                           : nullptr;
    size_t most = limit == nullptr ? kDaemonCandidates
                                   : static_cast<size_t>(std::max(limit->intValue(), int64_t{0}));
    _fixed = !raised || most != _step;
    _lookedAt = most;
    if (!raised) most = std::min(most, _request.wanted);
    const int64_t maximum = !raised && _request.wanted == SIZE_MAX
                                ? client::SearchServiceProxy::kNoMaximum
                                : static_cast<int64_t>(most);
    std::optional<TLError> failure;
    auto items = _service.searchItems(*sent, 0, _request.protectionClass, maximum, &failure);
    if (!items && asksForNothing(failure)) return ResultItems();
    if (!items) {
      platform::setError(error, *failure);
      return std::nullopt;
    }
    _truncated = _truncated || items->size() >= most;
    return items;
  }

  // If the daemon does not support this, the search does not fail.
  void noteReplacedWords() {
    auto words = _service.replacedWords(nullptr);
    if (!words) return;
    for (auto& word : *words) {
      if (std::find(_replaced.begin(), _replaced.end(), word) == _replaced.end()) {
        _replaced.push_back(std::move(word));
      }
    }
  }

  // The results of a branch, in the daemon's order.
  std::optional<ResultItems> resultsOf(const Branch& branch, TLErrorOut error) {
    auto items = ask(*branch.query, error);
    if (!items || items->empty()) return items;
    if (branch.modifiable) noteReplacedWords();
    std::unordered_set<std::string> out;
    for (const auto& query : branch.without) {
      const auto unwanted = ask(*query, error);
      if (!unwanted) return std::nullopt;
      for (const auto& item : *unwanted) out.insert(identifierOf(*item));
    }
    std::erase_if(*items, [&](const auto& item) { return out.contains(identifierOf(*item)); });
    return items;
  }

  std::optional<std::vector<Candidate>> gather(TLErrorOut error) {
    std::vector<Candidate> candidates;
    std::unordered_map<std::string, size_t> known;
    for (const Branch& branch : _plan.branches) {
      const auto items = resultsOf(branch, error);
      if (!items) return std::nullopt;
      for (const auto& item : *items) {
        const auto [at, added] = known.try_emplace(identifierOf(*item), candidates.size());
        if (added) candidates.push_back({item, {}});
        Candidate& candidate = candidates[at->second];
        candidate.branches.push_back(&branch);
        if (scoreOf(*item) > scoreOf(*candidate.item)) candidate.item = item;
      }
    }
    if (_plan.branches.size() > 1) {
      std::stable_sort(candidates.begin(), candidates.end(), ranksBefore);
    }
    return candidates;
  }

  SearchResults check(const std::vector<Candidate>& candidates) {
    SearchResults results;
    for (const Candidate& candidate : candidates) {
      const bool enough = !_request.complete && results.items.size() >= _request.wanted;
      if (enough || _request.stop.stop_requested()) {
        results.complete = false;
        break;
      }
      const bool holds = std::any_of(
          candidate.branches.begin(), candidate.branches.end(), [&](const Branch* branch) {
            return std::all_of(branch->checks.begin(), branch->checks.end(),
                               [&](const Check& one) { return passes(*candidate.item, one); });
          });
      if (holds) results.items.push_back(candidate.item);
    }
    return results;
  }

  // If the mail cannot be read, neither the condition nor its negation holds.
  bool passes(const TLIndexableItem& item, const Check& check) {
    const auto holds = value(item, check.node);
    return holds && *holds != check.negated;
  }

  std::optional<bool> value(const TLIndexableItem& item, const usersyntax::Node& node) {
    switch (node.kind) {
      case Kind::date: {
        const auto date = dateOf(item);
        return date && node.dates.holds(*date);
      }
      case Kind::flag:
        return flagOf(item, node.flag);
      case Kind::size: {
        const auto size = _facts.size(identifierOf(item));
        if (!size) return std::nullopt;
        return node.larger ? *size > node.bytes : *size < node.bytes;
      }
      default:
        return textValue(item, node);
    }
  }

  std::optional<bool> flagOf(const TLIndexableItem& item, usersyntax::Flag flag) {
    if (flag == usersyntax::Flag::junk) {
      for (const char* const name : {"junk", "spam"}) {
        if (isFolderMeant(folderName(item), folderPath(item), name)) return true;
      }
    }
    return _facts.flag(identifierOf(item), flag);
  }

  std::optional<bool> textValue(const TLIndexableItem& item, const usersyntax::Node& node) {
    if (node.field == Field::folder) {
      return isFolderMeant(folderName(item), folderPath(item), node.text);
    }
    const std::string identifier = identifierOf(item);
    if (node.field == Field::id || node.field == Field::list) {
      if (node.field == Field::id && node.text == identifier) return true;
      const auto head = _facts.head(identifier);
      if (!head) return std::nullopt;
      if (node.field == Field::list) {
        return usersyntax::folded(head->listID).find(usersyntax::folded(node.text)) !=
               std::string::npos;
      }
      const bool bracketed = node.text.starts_with('<') && node.text.ends_with('>');
      return head->messageID == (bracketed ? node.text.substr(1, node.text.size() - 2) : node.text);
    }
    const auto whole = _facts.item(identifier);
    if (whole == nullptr) return std::nullopt;
    return holdsText(*whole, node);
  }

  const SearchPlan& _plan;
  const SearchRequest& _request;
  client::SearchServiceProxy& _service;
  MailFacts& _facts;
  size_t _step = 0;      // number of candidates requested
  size_t _lookedAt = 0;  // the daemon's maximum number of candidates
  std::vector<client::ReplacedWord> _replaced;
  bool _truncated = false;
  bool _fixed = false;  // requesting more candidates changes nothing
};

}  // namespace

std::optional<SearchResults> runPlan(const SearchPlan& plan, const SearchRequest& request,
                                     client::SearchServiceProxy& service, MailFacts& facts,
                                     TLErrorOut error) {
  return Run(plan, request, service, facts).run(error);
}

}  // namespace cli
