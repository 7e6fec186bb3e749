#pragma once

#include <cstdint>
#include <string>
#include <utility>
#include <vector>

#include "platform/Text.h"

// A group of alternative tokens with scores, created by the query processor and evaluated by the
// text index. A token with a trailing space is a whole word, one without is a prefix. Immutable.
class TALTerm {
 public:
  // There must be one token score per token, and one zone score per zone ID.
  TALTerm(std::vector<TLString> tokens, std::vector<double> tokenScores, double scoreNoMatch,
          std::vector<int32_t> zoneIDs, std::vector<double> zoneScores, bool isUnigram)
      : _tokens(std::move(tokens)),
        _tokenScores(std::move(tokenScores)),
        _scoreNoMatch(scoreNoMatch),
        _zoneIDs(std::move(zoneIDs)),
        _zoneScores(std::move(zoneScores)),
        _isUnigram(isUnigram) {}

  // A match of any of them matches the term.
  [[nodiscard]] const std::vector<TLString>& tokens() const { return _tokens; }
  [[nodiscard]] const std::vector<double>& tokenScores() const { return _tokenScores; }
  // The score of a document that no token matches: 0 makes the term required, 1 makes it a pure
  // bonus.
  [[nodiscard]] double scoreNoMatch() const { return _scoreNoMatch; }
  // The zones to search.
  [[nodiscard]] const std::vector<int32_t>& zoneIDs() const { return _zoneIDs; }
  [[nodiscard]] const std::vector<double>& zoneScores() const { return _zoneScores; }
  // True for a single query word: only such terms are modified when a search finds too little.
  [[nodiscard]] bool isUnigram() const { return _isUnigram; }

  // For people to read: ["a b " 2] nomatch:0.8 zones:{13:0.9,...} unigram.
  [[nodiscard]] std::string description() const;

 private:
  std::vector<TLString> _tokens;
  std::vector<double> _tokenScores;
  double _scoreNoMatch;
  std::vector<int32_t> _zoneIDs;
  std::vector<double> _zoneScores;
  bool _isUnigram;
};
