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

// A possible correction of a word.
struct TALCorrectionCandidate {
  float _scoreError = 0;       // closeness to the typed word, higher is closer
  float _scoreTopicality = 0;  // best document score of the corrected query
  float _scoreOverall = 0;     // their sum
  std::string _token;          // with a trailing space if the term has one
};

// Spelling correction: replaces the one word of a query that matches nothing by a similar word in
// the index, at an edit distance of one or else among the most frequent words.
//
// A token with a trailing space is a whole word, one without is a prefix; candidates take the same
// form. Threads: any number of corrections may run at once. The index must outlive the call.
class TALSpellCorrection {
 public:
  static constexpr int64_t kCandidateBudget = 1000;
  static constexpr int64_t kInLexiconCandidateBudget = 100;

  explicit TALSpellCorrection(std::shared_ptr<const TALTopKVocab> topKVocab,
                              int64_t candidateBudget = kCandidateBudget,
                              int64_t inLexiconCandidateBudget = kInLexiconCandidateBudget);

  // `terms` must come from a search, which sets `found`. On success, `correctedTerms` is `terms`
  // with the first token of one term replaced, at score 1, and the result, above 0, rates the
  // correction. Otherwise the result is -1 and `correctedTerms` is unchanged.
  [[nodiscard]] float correctSpelling(const std::vector<saltsearch::Term>& terms,
                                      std::vector<saltsearch::Term>& correctedTerms,
                                      const salt::Index& withTextStore) const;

  // "a" to "z".
  [[nodiscard]] static const std::array<std::string, 26>& kLettersEn();

  // The words at an edit distance of one from `word`, which must be ASCII. For each position: a
  // swap, a deletion, replacements and insertions; then appended letters. Words of one letter have
  // none.
  [[nodiscard]] std::vector<TALCorrectionCandidate> editOneCandidates(std::string_view word) const;

  // Whether a term must not be corrected.
  [[nodiscard]] static bool _doNotCorrect(const saltsearch::Term& term);

  // The candidates for the first token of `term`: those at edit distance one that the index
  // contains, or else those of the vocabulary.
  [[nodiscard]] std::vector<TALCorrectionCandidate> _getCandidates(
      std::string_view word, saltsearch::Term term, const salt::Index& textStore) const;
  // `isPrefix` is ignored.
  [[nodiscard]] std::vector<TALCorrectionCandidate> _getCandidatesFromTopKVocab(
      std::string_view word, bool isPrefix) const;

  static const platform::Log& log();

 private:
  // Keeps the candidates with a document in the index, in order and up to the budget, and restores
  // the trailing space of their tokens.
  std::vector<TALCorrectionCandidate> _foundInIndex(std::vector<TALCorrectionCandidate> candidates,
                                                    bool wholeWord, const saltsearch::Term& term,
                                                    const salt::Index& textStore) const;
  static void score(const std::vector<saltsearch::Term>& terms, size_t target,
                    const salt::Index& textStore, std::vector<TALCorrectionCandidate>* candidates);

  const int64_t _candidateBudget;
  const int64_t _inLexiconCandidateBudget;
  const std::shared_ptr<const TALTopKVocab> _topKVocab;  // may be null
};
