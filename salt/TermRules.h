#pragma once

#include <algorithm>
#include <cstdint>
#include <vector>

#include "salt/Search.h"

// How the fields of terms determine a document's score, shared by all evaluators of queries.
namespace saltsearch {

// False, with a log line, for a term that is skipped.
[[nodiscard]] bool wellFormed(const Term& term);

// Upper bounds of what the terms from one on can multiply a score by, computed from the last term
// backwards. They let a search drop documents early.
struct Bounds {
  std::vector<double> zone;     // for one term: sum of its zone weights, at most 1
  std::vector<double> matched;  // highest product when at least one of the terms matches
  std::vector<double> any;      // highest product
};
[[nodiscard]] Bounds boundsOf(const std::vector<Term>& terms);

// Maps a zone to its bit in a zone mask, 0 when a match there does not count.
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

// The summed weights of the term's zones in the mask, at most 1.0.
[[nodiscard]] double zoneFactor(const Term& term, uint32_t zoneMask);

// The state of one document during a search.
struct Standing {
  uint32_t docID = 0;
  bool in = false;   // is a candidate
  double score = 0;  // so far, while it is a candidate
};

// Takes documents through the terms one after another. A document becomes a candidate with the
// first term that matches it, and is dropped when no later term can raise it to the threshold.
// Results for one document do not depend on any other. The terms and options outlive it.
class Evaluation {
 public:
  Evaluation(const std::vector<Term>& terms, const Options& options);

  // Whether term u is malformed and skipped.
  [[nodiscard]] bool skips(size_t u) const { return _steps[u].skipped; }

  // Whether term u cannot make any document a candidate.
  [[nodiscard]] bool admitsNobody(size_t u) const { return _steps[u].admitsNobody; }

  // Whether term u is required: a document that it does not match cannot be a result.
  [[nodiscard]] bool demandsMatch(size_t u) const { return _steps[u].required; }

  // Applies term u to the documents. maskOf(token, i) is the zone mask of the token's match in
  // docs[i], 0 for none.
  template <typename MaskOf>
  void apply(size_t u, const MaskOf& maskOf, std::vector<Standing>& docs) const {
    const Step& step = _steps[u];
    const Term& term = _terms[u];
    for (size_t i = 0; i < docs.size(); ++i) {
      DocResult match;
      for (size_t t = 0; t < term.tokens.size(); ++t) {
        take(step, term, t, maskOf(t, i), docs[i], match);
      }
      if (!docs[i].in) continue;
      double& score = docs[i].score;
      score *= match.tokenScore == kNoMatch ? term.defaultScore
                                            : match.tokenScore * zoneFactor(term, match.zoneMask);
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
    std::vector<bool>
        refuses;           // by token: a document that it matches first cannot reach the threshold
    double unmatched = 1;  // score so far of a document that no term has matched
    double need = 0;       // a lower score cannot reach the threshold with the later terms
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
