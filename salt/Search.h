#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "salt/Index.h"

// Evaluates a conjunction of scored terms: the documents with the highest scores.
//
//   score(d)   = term_1(d) * term_2(d) * ... * term_n(d)
//   term(d)    = tokenScore(d) * zoneFactor(d)   if any token of the term matches in d
//              = defaultScore                    otherwise
//   tokenScore = the highest (isMin: the lowest) score of the tokens that match
//   zoneFactor = min(1, sum of the weights of the zones in which they match); 1 without zones
//
// A result matches at least one term and scores at least `Options::threshold`. With a threshold
// above 0, a term with a defaultScore of 0 is required.
namespace saltsearch {

// Upper bound of zones in a term; a term with more is skipped with a log line.
inline constexpr size_t kMaxTermZones = 31;

// A group of alternative tokens; see the formula above.
struct Term {
  std::vector<std::string> tokens;  // prefixes to scan for
  std::vector<double> tokenScores;  // one for each token
  std::vector<uint16_t> zones;     // where a match counts; empty: anywhere; 0: all zones not listed
  std::vector<double> zoneScores;  // one for each zone
  double defaultScore = 0;
  bool isMin = false;
  bool isUnigram = false;  // ignored by Search; for code that rewrites queries
  bool found = false;      // set by Search when a scan of this term found a suffix

  // {MIN "token":score | ... zones:{zone:weight,...} default:score}
  explicit operator std::string() const;
};

struct Options {
  size_t maxResults = 0;   // size of the result list; 0 gives an empty list
  size_t maxSuffixes = 0;  // upper bound of suffixes taken for a term, over all its tokens
  double threshold = 0;    // lowest score to return
};

struct DocResult {
  uint32_t docID = 0;
  uint32_t zoneMask = 0;  // during the search: one bit for each matched index into Term::zones
  double score = 0;
  double tokenScore = -1;  // during the search: -1 if the current term has not matched

  // "docID:score".
  explicit operator std::string() const;
};

// The top documents, highest score first; ties by DocID, largest first. Malformed terms are logged
// and skipped. Sets Term::found. Runs on the calling thread, concurrently with everything that
// ScanPrefix allows.
[[nodiscard]] std::vector<DocResult> Search(const salt::Index& index, std::vector<Term>& terms,
                                            const Options& options);

// 1.0 for every zone.
[[nodiscard]] double ZoneScoreDefault(uint32_t docID, uint16_t zone);

}  // namespace saltsearch
