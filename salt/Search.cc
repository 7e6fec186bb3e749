#include "salt/Search.h"

#include <fmt/format.h>

#include <algorithm>
#include <cstdint>
#include <optional>
#include <utility>

#include "salt/DocPages.h"
#include "salt/TermMatches.h"
#include "salt/TermRules.h"

namespace saltsearch {

namespace {

// Bounds the memory for matches: how many required terms are scanned before the others.
constexpr size_t kMaxTermsAhead = 8;

// One search. Required terms are scanned first: only documents that match all of them can be
// results, so the scans of the other terms skip all other documents, usually the great majority.
class Searching {
 public:
  Searching(const salt::Index& index, std::vector<Term>& terms, const Options& options)
      : _index(index),
        _terms(terms),
        _options(options),
        _evaluation(terms, options),
        _matches(terms.size()) {}

  std::vector<Standing> run() {
    scanAhead();
    for (size_t u = 0; u < _terms.size(); ++u) {
      if (!_evaluation.skips(u)) evaluate(u);
    }
    return std::move(_docs);
  }

  [[nodiscard]] bool accepts(const Standing& doc) const { return _evaluation.accepts(doc); }

 private:
  void scanAhead() {
    const TermMatches* latest = nullptr;
    size_t ahead = 0;
    for (size_t u = 0; u < _terms.size() && ahead < kMaxTermsAhead; ++u) {
      if (_evaluation.skips(u) || !_evaluation.demandsMatch(u)) continue;
      if (latest != nullptr) restrictTo(*latest);
      _matches[u] = scan(u);
      latest = &*_matches[u];
      ++ahead;
    }
    if (latest == nullptr) return;
    _admitted = {};
    admit(*latest);
    _selective = true;
  }

  void restrictTo(const TermMatches& matches) {
    _admitted = {};
    matches.forEach([this](uint32_t docID, uint32_t) { _admitted[docID] = true; });
    _selective = true;
  }

  TermMatches scan(size_t u) {
    return {_index, _terms[u], _options.maxSuffixes, _selective ? &_admitted : nullptr};
  }

  void evaluate(size_t u) {
    if (!_matches[u]) {
      if (nothingCanChange(u)) return setFound(_index, _terms[u]);
      _matches[u] = scan(u);
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
    matches.forEach([this](uint32_t docID, uint32_t) {
      if (!std::exchange(_admitted[docID], true)) _docs.push_back({docID});
    });
  }

  const salt::Index& _index;
  std::vector<Term>& _terms;
  const Options& _options;
  const Evaluation _evaluation;
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
