#pragma once

#include <array>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "modification/TALTopKVocab.h"
#include "platform/Log.h"
#include "salt/Index.h"
#include "salt/Search.h"

// A word that might have been meant.
struct TALCorrectionCandidate {
  float _scoreError = 0;       // closeness to the typed word, higher is closer
  float _scoreTopicality = 0;  // best document score of the corrected query
  float _scoreOverall = 0;     // their sum
  std::string _token;          // with a trailing blank when the term has one
};

// Replaces the one word of a query that matches nothing by a near one that the index holds: by a
// word at one edit from it, or else by one of the most frequent words.
//
// A token with a trailing blank is a whole word, one without is a prefix; candidates are the same.
// Threads: any number may correct at once, each in an index of its own, which outlives the call.
class TALSpellCorrection {
 public:
  static constexpr int64_t kCandidateBudget = 1000;
  static constexpr int64_t kInLexiconCandidateBudget = 100;

  explicit TALSpellCorrection(std::shared_ptr<const TALTopKVocab> topKVocab,
                              int64_t candidateBudget = kCandidateBudget,
                              int64_t inLexiconCandidateBudget = kInLexiconCandidateBudget);

  // `terms` as a search has left them, `found` set. Above 0: `correctedTerms` is `terms` with
  // another first token, of score 1, in one term, and the result is how good it is; else -1, and
  // `correctedTerms` is what it was.
  [[nodiscard]] float correctSpelling(const std::vector<saltsearch::Term>& terms,
                                      std::vector<saltsearch::Term>& correctedTerms,
                                      const salt::Index& withTextStore) const;

  // "a" to "z".
  [[nodiscard]] static const std::array<std::string, 26>& kLettersEn();

  // The words at one edit from `word`, which is ASCII: by the position of the edit, at each a swap,
  // a deletion, replacements and insertions; then appended letters. Words of one letter have none.
  [[nodiscard]] std::vector<TALCorrectionCandidate> editOneCandidates(std::string_view word) const;

  // Whether a term must stay as it is.
  [[nodiscard]] static bool _doNotCorrect(const saltsearch::Term& term);

  // The candidates for the first token of `term`: those at one edit that the index holds, else
  // those of the vocabulary.
  [[nodiscard]] std::vector<TALCorrectionCandidate> _getCandidates(
      std::string_view word, saltsearch::Term term, const salt::Index& textStore) const;
  // `isPrefix` makes no difference.
  [[nodiscard]] std::vector<TALCorrectionCandidate> _getCandidatesFromTopKVocab(
      std::string_view word, bool isPrefix) const;

  static const platform::Log& log();

 private:
  // The candidates of which the index holds a document, in order, up to the budget; their tokens
  // get the blank back.
  std::vector<TALCorrectionCandidate> _foundInIndex(std::vector<TALCorrectionCandidate> candidates,
                                                    bool wholeWord, const saltsearch::Term& term,
                                                    const salt::Index& textStore) const;
  static void score(const std::vector<saltsearch::Term>& terms, size_t target,
                    const salt::Index& textStore, std::vector<TALCorrectionCandidate>* candidates);

  const int64_t _candidateBudget;
  const int64_t _inLexiconCandidateBudget;
  const std::shared_ptr<const TALTopKVocab> _topKVocab;  // may be null
};
