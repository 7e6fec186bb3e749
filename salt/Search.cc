#include "salt/Search.h"

#include <fmt/format.h>

#include <algorithm>
#include <cstdint>

#include "salt/Candidates.h"
#include "salt/TermRules.h"
#include "salt/ZoneMask.h"

namespace saltsearch {

namespace {

// The evaluation of one term: collects its matches, then multiplies them into the scores.
class TermRun {
 public:
  // `unmatched` is the score, so far, of documents that no term has matched; `matched` and `any`
  // are the bounds of the terms after this one, `zone` that of this one.
  TermRun(Term& term, const Options& options, Candidates* candidates, double unmatched, double zone,
          double matched, double any)
      : _term(term),
        _options(options),
        _candidates(*candidates),
        _unmatched(unmatched),
        _zoneBound(zone),
        _reach(unmatched * term.defaultScore * matched),
        _need(options.threshold / any),
        _zoneBits(term.zones) {}

  void collect(const salt::Index& index) {
    for (size_t t = 0; t < _term.tokens.size(); ++t) {
      _tokenScore = _term.tokenScores[t];
      _noNewDocs = refusesNewDocs(t);
      if (nothingCanChange(t)) {
        index.ScanPrefix(_term.tokens[t], [this](const salt::SuffixMeta&) {
          _term.found = true;
          return false;
        });
        return;
      }
      scan(index, _term.tokens[t]);
    }
  }

  // Neighbouring documents mostly match in the same zones.
  void score() {
    uint32_t latestMask = 0;
    double latestFactor = zoneFactor(_term, latestMask);
    _candidates.retain([&](DocResult& doc) {
      if (doc.zoneMask != latestMask) {
        latestMask = doc.zoneMask;
        latestFactor = zoneFactor(_term, latestMask);
      }
      doc.score *= doc.tokenScore == -1.0 ? _term.defaultScore : doc.tokenScore * latestFactor;
      if (_reach < _options.threshold && doc.score < _need) return false;
      doc.tokenScore = -1.0;
      doc.zoneMask = 0;
      return true;
    });
  }

 private:
  // Whether no document is left, and this token, the last one, adds none.
  [[nodiscard]] bool nothingCanChange(size_t token) const {
    return _noNewDocs && _candidates.all().empty() && token + 1 == _term.tokens.size();
  }

  // Whether a document that only this token, or where a later one can raise it those too, finds now
  // stays below the threshold.
  [[nodiscard]] bool refusesNewDocs(size_t token) const {
    if (_options.threshold <= _reach) return false;
    double best = _term.tokenScores[token];
    if (_term.isMin || _term.zones.size() > 1) {
      const auto from = _term.tokenScores.begin() + static_cast<ptrdiff_t>(token);
      best = *std::max_element(from, _term.tokenScores.end());
    }
    return _unmatched * best * _zoneBound < _need;
  }

  void scan(const salt::Index& index, const std::string& token) {
    const auto suffixes =
        index.ScanPlaces(token, left(), [this](const auto& zones, const auto* docs, size_t count) {
          salt::ZoneMaskMap bits(zones, [this](uint16_t zone) { return _zoneBits.of(zone); });
          for (const salt::DocZones* doc = docs; doc != docs + count; ++doc) {
            take(doc->DocID, bits.of(doc->zones));
          }
        });
    if (suffixes) {
      _term.found = _term.found || *suffixes != 0;
      _suffixes += *suffixes;
      return;
    }
    index.ScanPrefix(token, [this](const salt::SuffixMeta& meta) {
      ++_suffixes;
      _term.found = true;
      if (_suffixes > _options.maxSuffixes) return false;
      take(meta.DocID, _zoneBits.of(meta.ZoneID));
      return true;
    });
  }

  // Suffixes that the term may still take.
  [[nodiscard]] size_t left() const {
    return _options.maxSuffixes - std::min(_options.maxSuffixes, _suffixes);
  }

  // Places of a document, or the same again: the second time changes nothing.
  void take(uint32_t docID, uint32_t bits) {
    if (bits == 0) return;
    if (DocResult* const known = _candidates.find(docID)) {
      match(known, bits);
    } else if (!_noNewDocs) {
      _candidates.add({docID, bits, _unmatched, _tokenScore});
    }
  }

  void match(DocResult* doc, uint32_t bits) const {
    if (doc->tokenScore == -1.0) {
      doc->tokenScore = _tokenScore;
    } else {
      doc->tokenScore = _term.isMin ? std::min(doc->tokenScore, _tokenScore)
                                    : std::max(doc->tokenScore, _tokenScore);
    }
    doc->zoneMask |= bits;
  }

  Term& _term;
  const Options& _options;
  Candidates& _candidates;
  const double _unmatched;
  const double _zoneBound;
  const double _reach;  // best score of a document that neither this term nor one before matched
  const double _need;   // running score below which no later term brings a document up
  const ZoneBits _zoneBits;
  double _tokenScore = 0;
  bool _noNewDocs = false;
  size_t _suffixes = 0;
};

bool ranksAbove(const DocResult& left, const DocResult& right) {
  return left.score > right.score || (left.score == right.score && left.docID > right.docID);
}

std::vector<DocResult> topDocs(const std::vector<DocResult>& results, const Options& options) {
  std::vector<DocResult> heap;
  if (options.maxResults == 0) return heap;
  for (const DocResult& doc : results) {
    if (doc.score < options.threshold) continue;
    if (heap.size() == options.maxResults) {
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
  const Bounds bounds = boundsOf(terms);
  Candidates candidates;
  double unmatched = 1.0;
  for (size_t u = 0; u < terms.size(); ++u) {
    if (!wellFormed(terms[u])) continue;
    TermRun run(terms[u], options, &candidates, unmatched, bounds.zone[u], bounds.matched[u + 1],
                bounds.any[u + 1]);
    run.collect(index);
    run.score();
    unmatched *= terms[u].defaultScore;
  }
  return topDocs(candidates.all(), options);
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
