#include "salt/Alternatives.h"

#include <algorithm>
#include <limits>
#include <utility>

#include "salt/TermMatches.h"
#include "salt/TermRules.h"

namespace saltsearch {

namespace {

// Bounds the candidate documents held at a time, over all tokens: about 12 MB, plus what the token
// with the most documents needs.
constexpr size_t kMaxStandings = 500000;

// Evaluates the candidate documents of many tokens together, so that each of the other terms is
// scanned only once.
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
      while (last < tokens.size() && _standings < kMaxStandings) add(tokens[last++]);
      evaluate();
      for (const Matches& matches : _byToken) {
        for (const Standing& standing : matches.docs) {
          if (!_evaluation.accepts(standing)) continue;
          const double score = standing.score;
          result[first] = std::max(score, result[first].value_or(score));
        }
        ++first;
      }
      _byToken.clear();
      _standings = 0;
    }
    return result;
  }

 private:
  // The documents that one token matches, with the zone mask of each.
  struct Matches {
    std::vector<Standing> docs;
    std::vector<uint32_t> masks;
  };

  void add(const std::string& token) {
    _terms[_position].tokens[0] = token;
    const TermMatches found(_index, _terms[_position], _options.maxSuffixes);
    Matches& matches = _byToken.emplace_back();
    found.forEach([&](uint32_t docID) {
      matches.docs.push_back({docID});
      matches.masks.push_back(found.mask(0, docID));
    });
    _standings += matches.docs.size();
  }

  void evaluate() {
    for (size_t u = 0; u < _terms.size(); ++u) {
      if (_evaluation.skips(u)) continue;
      if (u == _position) {
        applyToken();
        continue;
      }
      const TermMatches found(_index, _terms[u], _options.maxSuffixes);
      for (auto& [docs, masks] : _byToken) {
        const auto maskOf = [&found, &docs = docs](size_t token, size_t i) {
          return found.mask(token, docs[i].docID);
        };
        _evaluation.apply(u, maskOf, docs);
      }
    }
  }

  // A document that is no candidate after the required term never becomes one.
  void applyToken() {
    for (auto& [docs, masks] : _byToken) {
      _evaluation.apply(
          _position, [&masks = masks](size_t, size_t i) { return masks[i]; }, docs);
      std::erase_if(docs, [](const Standing& standing) { return !standing.in; });
      masks.clear();
    }
  }

  const salt::Index& _index;
  const Evaluation& _evaluation;
  std::vector<Term> _terms;
  const size_t _position;
  const Options& _options;
  std::vector<Matches> _byToken;
  size_t _standings = 0;
};

bool oneTokenEach(const std::vector<Term>& terms) {
  return std::all_of(terms.begin(), terms.end(), [](const Term& term) {
    return term.tokens.size() == 1 && term.tokenScores.size() == 1;
  });
}

// Runs a separate search for each token.
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
  // If the term is not required, a document without the token could have the best score.
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
