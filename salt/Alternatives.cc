#include "salt/Alternatives.h"

#include <algorithm>
#include <limits>
#include <utility>

#include "salt/Candidates.h"
#include "salt/DocSet.h"
#include "salt/TermRules.h"
#include "salt/ZoneMask.h"

namespace saltsearch {

namespace {

// The documents that a term of one token matches, of those that are wanted: of all without
// `wanted`.
Candidates matchesOf(const salt::Index& index, const Term& term, size_t maxSuffixes,
                     const salt::DocSet* wanted) {
  const ZoneBits zoneBits(term.zones);
  Candidates found;
  const auto take = [&](uint32_t docID, uint32_t bits) {
    if (bits == 0 || (wanted != nullptr && !wanted->contains(docID))) return;
    if (DocResult* const known = found.find(docID)) {
      known->zoneMask |= bits;
    } else {
      found.add({docID, bits, 0, term.tokenScores[0]});
    }
  };
  const auto suffixes = index.ScanPlaces(
      term.tokens[0], std::numeric_limits<uint64_t>::max(),
      [&](const auto& zones, const auto* docs, size_t count) {
        salt::ZoneMaskMap bits(zones, [&](uint16_t zone) { return zoneBits.of(zone); });
        for (const salt::DocZones* doc = docs; doc != docs + count; ++doc) {
          take(doc->DocID, bits.of(doc->zones));
        }
      });
  if (suffixes && *suffixes <= maxSuffixes) return found;
  found = Candidates();
  size_t taken = 0;
  index.ScanPrefix(term.tokens[0], [&](const salt::SuffixMeta& meta) {
    if (++taken > maxSuffixes) return false;
    take(meta.DocID, zoneBits.of(meta.ZoneID));
    return true;
  });
  return found;
}

// A document that a token matches, on its way through the terms.
struct Standing {
  uint32_t docID = 0;
  uint32_t zoneMask = 0;  // of the token's match
  bool in = false;        // among the candidates of the search
  double score = 0;       // while it is in
};

// How Search takes a document through the terms, for terms of one token each.
class Evaluation {
 public:
  Evaluation(const std::vector<Term>& terms, const Options& options)
      : _terms(terms), _options(options), _steps(terms.size()) {
    const Bounds bounds = boundsOf(terms);
    double unmatched = 1.0;
    for (size_t u = 0; u < terms.size(); ++u) {
      Step& step = _steps[u];
      step.skipped = !wellFormed(terms[u]);
      if (step.skipped) continue;
      step.unmatched = unmatched;
      unmatched *= terms[u].defaultScore;
      step.prunes = unmatched * bounds.matched[u + 1] < options.threshold;
      step.need = options.threshold / bounds.any[u + 1];
      step.refusesNewDocs =
          step.prunes && step.unmatched * terms[u].tokenScores[0] * bounds.zone[u] < step.need;
    }
  }

  [[nodiscard]] bool skips(size_t u) const { return _steps[u].skipped; }

  // Term u, of which `matched` is what it knows of the document, null for nothing.
  void apply(size_t u, const DocResult* matched, Standing* doc) const {
    const Step& step = _steps[u];
    if (matched != nullptr && !doc->in && !step.refusesNewDocs) {
      doc->in = true;
      doc->score = step.unmatched;
    }
    if (!doc->in) return;
    doc->score *= matched != nullptr ? factorOf(_terms[u], *matched) : _terms[u].defaultScore;
    if (step.prunes && doc->score < step.need) doc->in = false;
  }

  [[nodiscard]] bool accepts(const Standing& doc) const {
    return doc.in && doc.score >= _options.threshold;
  }

 private:
  struct Step {
    bool skipped = false;
    bool prunes = false;
    bool refusesNewDocs = false;
    double unmatched = 1;  // score, so far, of documents that no term has matched
    double need = 0;       // running score below which no later term brings a document up
  };

  const std::vector<Term>& _terms;
  const Options& _options;
  std::vector<Step> _steps;
};

// Documents of all tokens that are on their way at once: bounds the memory to some 12 MB, and what
// the largest token takes.
constexpr size_t kMostStandings = 500000;

// Takes the documents of many tokens through the terms together, so that each other term is scanned
// for once.
class SharedSearch {
 public:
  SharedSearch(const salt::Index& index, const Evaluation& evaluation, std::vector<Term> terms,
               size_t position, const Options& options)
      : _index(index),
        _evaluation(evaluation),
        _terms(std::move(terms)),
        _position(position),
        _options(options) {}

  std::vector<std::optional<double>> best(const std::vector<std::string>& tokens) {
    std::vector<std::optional<double>> result(tokens.size());
    for (size_t first = 0; first < tokens.size();) {
      size_t last = first;
      while (last < tokens.size() && _standings < kMostStandings) add(tokens[last++]);
      evaluate();
      for (const auto& docs : _byToken) {
        for (const Standing& doc : docs) {
          if (!_evaluation.accepts(doc)) continue;
          result[first] = std::max(doc.score, result[first].value_or(doc.score));
        }
        ++first;
      }
      _byToken.clear();
      _standings = 0;
      _wanted = salt::DocSet();
    }
    return result;
  }

 private:
  void add(const std::string& token) {
    _terms[_position].tokens[0] = token;
    const Candidates found = matchesOf(_index, _terms[_position], _options.maxSuffixes, nullptr);
    std::vector<Standing> docs;
    docs.reserve(found.all().size());
    for (const DocResult& doc : found.all()) {
      docs.push_back({doc.docID, doc.zoneMask});
      if (!_wanted.contains(doc.docID)) _wanted.insert(doc.docID);
    }
    _standings += docs.size();
    _byToken.push_back(std::move(docs));
  }

  void evaluate() {
    for (size_t u = 0; u < _terms.size(); ++u) {
      if (_evaluation.skips(u)) continue;
      if (u == _position) {
        applyToken();
        continue;
      }
      Candidates found = matchesOf(_index, _terms[u], _options.maxSuffixes, &_wanted);
      for (auto& docs : _byToken) {
        for (Standing& doc : docs) _evaluation.apply(u, found.find(doc.docID), &doc);
      }
    }
  }

  // Who is not in behind the required term never will be.
  void applyToken() {
    for (auto& docs : _byToken) {
      for (Standing& doc : docs) {
        const DocResult match{doc.docID, doc.zoneMask, 0, _terms[_position].tokenScores[0]};
        _evaluation.apply(_position, &match, &doc);
      }
      std::erase_if(docs, [](const Standing& doc) { return !doc.in; });
    }
  }

  const salt::Index& _index;
  const Evaluation& _evaluation;
  std::vector<Term> _terms;
  const size_t _position;
  const Options& _options;
  std::vector<std::vector<Standing>> _byToken;
  size_t _standings = 0;
  salt::DocSet _wanted;
};

bool oneTokenEach(const std::vector<Term>& terms) {
  return std::all_of(terms.begin(), terms.end(), [](const Term& term) {
    return term.tokens.size() == 1 && term.tokenScores.size() == 1;
  });
}

// One search a token.
std::vector<std::optional<double>> bestBySearch(const salt::Index& index, std::vector<Term> terms,
                                                size_t position,
                                                const std::vector<std::string>& tokens,
                                                const Options& options) {
  std::vector<std::optional<double>> best(tokens.size());
  for (size_t i = 0; i < tokens.size(); ++i) {
    terms[position].tokens[0] = tokens[i];
    const auto results = Search(index, terms, options);
    if (!results.empty()) best[i] = results[0].score;
  }
  return best;
}

}  // namespace

std::vector<bool> AnyDocument(const salt::Index& index, const Term& term,
                              const std::vector<std::string>& tokens, size_t maxSuffixes) {
  std::vector<bool> any(tokens.size());
  if (!oneTokenEach({term})) {
    std::vector<Term> terms{term};
    for (size_t i = 0; i < tokens.size(); ++i) {
      terms[0].tokens[0] = tokens[i];
      any[i] = !Search(index, terms, {1, maxSuffixes, 0}).empty();
    }
    return any;
  }
  if (!wellFormed(term)) return any;
  const ZoneBits zoneBits(term.zones);
  const auto found = index.ScanPrefixes(tokens, maxSuffixes);
  for (size_t i = 0; i < tokens.size(); ++i) {
    any[i] = std::any_of(found[i].begin(), found[i].end(), [&](const salt::SuffixMeta& meta) {
      return zoneBits.of(meta.ZoneID) != 0;
    });
  }
  return any;
}

std::vector<std::optional<double>> BestScores(const salt::Index& index,
                                              const std::vector<Term>& terms, size_t position,
                                              const std::vector<std::string>& tokens,
                                              const Options& options) {
  std::vector<Term> changed = terms;
  changed[position].tokenScores[0] = 1.0;
  // Else documents that the token is not in could be the best.
  const bool required = terms[position].defaultScore == 0 && options.threshold > 0;
  if (!required || !oneTokenEach(terms)) {
    return bestBySearch(index, std::move(changed), position, tokens, options);
  }
  const Evaluation evaluation(changed, options);
  if (evaluation.skips(position)) {
    return bestBySearch(index, std::move(changed), position, tokens, options);
  }
  return SharedSearch(index, evaluation, changed, position, options).best(tokens);
}

}  // namespace saltsearch
