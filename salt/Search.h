#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "salt/Index.h"

// Turns a conjunction of scored terms into the top documents.
namespace saltsearch {

// Most zones of a term; one with more is skipped with a log line.
inline constexpr size_t kMaxTermZones = 31;

// A group of alternative tokens. A document that any of them matches gets the score of its best
// (with isMin: worst) token times the summed weights, at most 1.0, of the zones it matched in; any
// other document gets `defaultScore`.
struct Term {
  std::vector<std::string> tokens;  // prefixes to scan for
  std::vector<double> tokenScores;  // as many as tokens
  std::vector<uint16_t> zones;      // where a match counts; empty: anywhere; 0: zones not listed
  std::vector<double> zoneScores;   // as many as zones
  double defaultScore = 0;
  bool isMin = false;
  bool isUnigram = false;  // not read by Search; for those who rewrite queries
  bool found = false;      // set by Search when a scan of this term delivered a suffix

  // {MIN "token":score | ... zones:{zone:weight,...} default:score}
  explicit operator std::string() const;
};

struct Options {
  size_t maxResults = 0;   // size of the result list; 0 gives an empty one
  size_t maxSuffixes = 0;  // most suffixes taken per term, over all its tokens
  double threshold = 0;    // lowest score worth returning
};

struct DocResult {
  uint32_t docID = 0;
  uint32_t zoneMask = 0;  // during the search: a bit for each matched index into Term::zones
  double score = 0;
  double tokenScore = -1;  // during the search: -1 when the current term has not matched

  // "docID:score".
  explicit operator std::string() const;
};

// The documents whose product of term scores reaches `options.threshold`, highest score first, of
// equal ones the larger docID first. Malformed terms are logged and skipped. Sets Term::found. Runs
// on the calling thread, at once with anything that ScanPrefix allows.
[[nodiscard]] std::vector<DocResult> Search(const salt::Index& index, std::vector<Term>& terms,
                                            const Options& options);

// 1.0 for every zone.
[[nodiscard]] double ZoneScoreDefault(uint32_t docID, uint16_t zone);

}  // namespace saltsearch
