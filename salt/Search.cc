#include "salt/Search.h"

#include <fmt/format.h>

#include <algorithm>
#include <cstdint>
#include <iterator>
#include <optional>
#include <string_view>
#include <utility>

#include "salt/DocPages.h"
#include "salt/TermMatches.h"
#include "salt/TermRules.h"

namespace saltsearch {

namespace {

// Bound the memory for matches: how many required terms are evaluated before the others, and how
// many tokens one scan looks for.
constexpr size_t kMaxTermsAhead = 8;
constexpr size_t kMaxTokensTogether = 8;

// One search. Required terms are scanned first: only documents that match all of them can be
// results, so of the other terms all other documents are skipped, usually the great majority.
class Searching {
 public:
  Searching(const salt::Index& index, std::vector<Term>& terms, const Options& options)
      : _index(index),
        _terms(terms),
        _options(options),
        _evaluation(terms, options),
        _found(terms.size()),
        _matches(terms.size()) {}

  std::vector<Standing> run() {
    matchRequired();
    for (size_t u = 0; u < _terms.size(); ++u) {
      if (!_evaluation.skips(u)) evaluate(u);
    }
    return std::move(_docs);
  }

  [[nodiscard]] bool accepts(const Standing& doc) const { return _evaluation.accepts(doc); }

 private:
  // Only documents that match all required terms can be results. They are among those of the rarest
  // one, which is looked through.
  void matchRequired() {
    std::vector<size_t> required;
    for (size_t u = 0; u < _terms.size() && required.size() < kMaxTermsAhead; ++u) {
      if (_evaluation.demandsMatch(u) && !_evaluation.skips(u)) required.push_back(u);
    }
    if (required.empty()) return;
    for (const size_t u : required) {
      if (_found[u].empty()) scanFrom(u, [this](size_t v) { return _evaluation.demandsMatch(v); });
      _matches[u] = matches(u);
    }
    const size_t rarest = *std::min_element(
        required.begin(), required.end(),
        [this](size_t u, size_t v) { return _matches[u]->suffixes() < _matches[v]->suffixes(); });
    std::erase(required, rarest);
    for (size_t page = 0; page < _matches[rarest]->pages(); ++page) {
      admitPage(page, *_matches[rarest], required);
    }
    _selective = true;
  }

  // Adds the documents of a page that `rarest` and all terms of `required` match. The loops over
  // the page have no branches, so that the compiler uses vector instructions.
  void admitPage(size_t page, const TermMatches& rarest, const std::vector<size_t>& required) {
    salt::MaskPage all;
    if (!rarest.matchPage(page, &all)) return;
    for (const size_t u : required) {
      salt::MaskPage one;
      if (!_matches[u]->matchPage(page, &one)) return;
      for (size_t i = 0; i < all.size(); ++i) all[i] = one[i] != 0 ? all[i] : 0;
    }
    for (size_t i = 0; i < all.size(); ++i) {
      if (all[i] != 0) _docs.push_back({static_cast<uint32_t>(page * all.size() + i)});
    }
  }

  // Scans for the tokens of term u, and in the same pass for those of later terms that are wanted
  // and not scanned yet, as far as they are few.
  template <typename Wanted>
  void scanFrom(size_t u, const Wanted& wanted) {
    std::vector<size_t> together{u};
    size_t tokens = _terms[u].tokens.size();
    for (size_t v = u + 1; v < _terms.size() && tokens < kMaxTokensTogether; ++v) {
      const size_t more = _terms[v].tokens.size();
      if (_evaluation.skips(v) || _matches[v] || !_found[v].empty() || !wanted(v) ||
          tokens + more > kMaxTokensTogether) {
        continue;
      }
      together.push_back(v);
      tokens += more;
    }
    std::vector<std::string_view> prefixes;
    for (const size_t v : together) {
      prefixes.insert(prefixes.end(), _terms[v].tokens.begin(), _terms[v].tokens.end());
    }
    auto found = _index.ScanPlaces(prefixes, _options.maxSuffixes);
    auto next = std::make_move_iterator(found.begin());
    for (const size_t v : together) {
      const auto end = next + static_cast<ptrdiff_t>(_terms[v].tokens.size());
      _found[v].assign(next, end);
      next = end;
    }
  }

  TermMatches matches(size_t u) {
    TermMatches::Found found = std::move(_found[u]);
    _found[u].clear();
    return {_index, _terms[u], std::move(found), _options.maxSuffixes};
  }

  void evaluate(size_t u) {
    if (!_matches[u]) {
      if (nothingCanChange(u)) return setFound(_index, _terms[u]);
      if (_found[u].empty()) scanFrom(u, [](size_t) { return true; });
      _matches[u] = matches(u);
      if (!_selective) admit(*_matches[u]);
    }
    const TermMatches& matches = *_matches[u];
    const auto maskOf = [&](size_t token, size_t i) { return matches.mask(token, _docs[i].docID); };
    _evaluation.apply(u, maskOf, _docs);
    _matches[u].reset();
  }

  // Whether no candidate is left and this term adds none.
  [[nodiscard]] bool nothingCanChange(size_t u) const {
    if (_selective && _docs.empty()) return true;
    return _evaluation.admitsNobody(u) &&
           std::none_of(_docs.begin(), _docs.end(), [](const Standing& doc) { return doc.in; });
  }

  // Adds the documents of the matches that are not yet in _docs.
  void admit(const TermMatches& matches) {
    matches.forEach([&](uint32_t docID, uint32_t) {
      if (!std::exchange(_admitted[docID], true)) _docs.push_back({docID});
    });
  }

  const salt::Index& _index;
  std::vector<Term>& _terms;
  const Options& _options;
  const Evaluation _evaluation;
  std::vector<TermMatches::Found> _found;            // of terms not yet matched
  std::vector<std::optional<TermMatches>> _matches;  // of terms not yet evaluated
  std::vector<Standing> _docs;
  salt::DocPages<bool> _admitted;  // documents in _docs
  bool _selective = false;         // only admitted documents can be results
};

bool ranksAbove(const DocResult& left, const DocResult& right) {
  return left.score > right.score || (left.score == right.score && left.docID > right.docID);
}

std::vector<DocResult> topDocs(const std::vector<Standing>& docs, const Searching& searching,
                               size_t maxResults) {
  std::vector<DocResult> heap;
  if (maxResults == 0) return heap;
  // Largest DocID first, so that ties are decided by the order of arrival.
  for (auto standing = docs.rbegin(); standing != docs.rend(); ++standing) {
    if (!searching.accepts(*standing)) continue;
    DocResult doc;
    doc.docID = standing->docID;
    doc.score = standing->score;
    if (heap.size() == maxResults) {
      if (!ranksAbove(doc, heap.front())) continue;
      std::pop_heap(heap.begin(), heap.end(), ranksAbove);
      heap.back() = doc;
    } else {
      heap.push_back(doc);
    }
    std::push_heap(heap.begin(), heap.end(), ranksAbove);
  }
  std::sort_heap(heap.begin(), heap.end(), ranksAbove);
  return heap;
}

}  // namespace

std::vector<DocResult> Search(const salt::Index& index, std::vector<Term>& terms,
                              const Options& options) {
  Searching searching(index, terms, options);
  return topDocs(searching.run(), searching, options.maxResults);
}

double ZoneScoreDefault(uint32_t, uint16_t) {
  return 1.0;
}

Term::operator std::string() const {
  std::string text = isMin ? "{MIN " : "{";
  for (size_t i = 0; i < tokens.size(); ++i) {
    if (i > 0) text += " | ";
    text += fmt::format("\"{}\":", tokens[i]);
    if (i < tokenScores.size()) text += fmt::format("{:g}", tokenScores[i]);
  }
  if (!zones.empty()) text += " zones:{";
  for (size_t i = 0; i < zones.size(); ++i) {
    if (i > 0) text += ',';
    text += fmt::format("{}:", zones[i]);
    if (i < zoneScores.size()) text += fmt::format("{:g}", zoneScores[i]);
  }
  if (!zones.empty()) text += '}';
  if (defaultScore > 0) text += fmt::format(" default:{:g}", defaultScore);
  return text + '}';
}

DocResult::operator std::string() const {
  return fmt::format("{}:{:g}", docID, score);
}

}  // namespace saltsearch
