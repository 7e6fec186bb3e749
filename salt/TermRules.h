#pragma once

#include <algorithm>
#include <cstdint>
#include <vector>

#include "salt/Search.h"

// What the fields of terms mean to the score of a document: for all who evaluate queries.
namespace saltsearch {

// False, with a log line, for a term that is passed over.
[[nodiscard]] bool wellFormed(const Term& term);

// What the terms from one on can still multiply a document's score by, computed from the last term
// back. It is what lets a search drop documents early.
struct Bounds {
  std::vector<double> zone;     // of one term: sum of its zone weights, at most 1
  std::vector<double> matched;  // highest product if at least one of the terms really matches
  std::vector<double> any;      // highest product
};
[[nodiscard]] Bounds boundsOf(const std::vector<Term>& terms);

// The bit in a zone mask that a match in a zone sets, 0 when it does not count.
class ZoneBits {
 public:
  explicit ZoneBits(const std::vector<uint16_t>& zones);

  [[nodiscard]] uint32_t of(uint16_t zoneID) const {
    const uint32_t bit = zoneID < _bits.size() ? _bits[zoneID] : 0;
    return bit != 0 ? bit : _others;
  }

 private:
  std::vector<uint32_t> _bits;  // by zone
  uint32_t _others = 0;
};

// The summed weights, at most 1.0, of the term's zones in the mask.
[[nodiscard]] double zoneFactor(const Term& term, uint32_t zoneMask);

// The state of one document during a search.
struct Standing {
  uint32_t docID = 0;
  bool in = false;   // among the candidates
  double score = 0;  // so far, while it is in
};

// How a search takes a document through its terms, one after the other: a document becomes a
// candidate with the first term that matches it, and is dropped when no later term can raise it to
// the threshold. The result for one document does not depend on any other. The terms and options
// outlive it.
class Evaluation {
 public:
  Evaluation(const std::vector<Term>& terms, const Options& options);

  // A malformed term, which is passed over.
  [[nodiscard]] bool skips(size_t u) const { return _steps[u].skipped; }

  // Whether term u makes no document a candidate that is not one already.
  [[nodiscard]] bool admitsNobody(size_t u) const { return _steps[u].admitsNobody; }

  // Whether a document that term u does not match cannot be in the result: the term is required.
  [[nodiscard]] bool demandsMatch(size_t u) const { return _steps[u].required; }

  // Takes documents through term u. maskOf(token, i) is the zone mask of the token's match in
  // docs[i], 0 for none.
  template <typename MaskOf>
  void apply(size_t u, const MaskOf& maskOf, std::vector<Standing>& docs) const {
    const Step& step = _steps[u];
    const Term& term = _terms[u];
    uint32_t latestMask = 0;  // neighbouring documents mostly match in the same zones
    double latestFactor = zoneFactor(term, latestMask);
    for (size_t i = 0; i < docs.size(); ++i) {
      DocResult match;
      for (size_t t = 0; t < term.tokens.size(); ++t) {
        take(step, term, t, maskOf(t, i), docs[i], match);
      }
      if (!docs[i].in) continue;
      if (match.zoneMask != latestMask) {
        latestMask = match.zoneMask;
        latestFactor = zoneFactor(term, latestMask);
      }
      double& score = docs[i].score;
      score *= match.tokenScore == kNoMatch ? term.defaultScore : match.tokenScore * latestFactor;
      if (step.prunes && score < step.need) docs[i].in = false;
    }
  }

  [[nodiscard]] bool accepts(const Standing& doc) const {
    return doc.in && !(doc.score < _options.threshold);
  }

 private:
  static constexpr double kNoMatch = -1.0;

  struct Step {
    bool skipped = false;
    bool required = false;
    bool prunes = false;
    bool admitsNobody = false;
    std::vector<bool> refuses;  // by token: a document that it is the first to match stays out
    double unmatched = 1;       // score, so far, of documents that no term has matched
    double need = 0;            // running score below which no later term brings a document up
  };

  static void take(const Step& step, const Term& term, size_t token, uint32_t mask,
                   Standing& standing, DocResult& match) {
    if (mask == 0) return;
    if (!standing.in) {
      if (step.refuses[token]) return;
      standing.in = true;
      standing.score = step.unmatched;
    }
    const double score = term.tokenScores[token];
    if (match.tokenScore == kNoMatch) {
      match.tokenScore = score;
    } else {
      match.tokenScore =
          term.isMin ? std::min(match.tokenScore, score) : std::max(match.tokenScore, score);
    }
    match.zoneMask |= mask;
  }

  const std::vector<Term>& _terms;
  const Options& _options;
  std::vector<Step> _steps;
};

}  // namespace saltsearch
