#pragma once

#include <cstddef>
#include <string>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <vector>

#include "platform/Log.h"
#include "platform/TLError.h"
#include "salt/Index.h"
#include "salt/Search.h"

// What a synonym of a query word is worth beside the word itself, in the first pass of a search.
inline constexpr float kSynonymScore = 0.1F;

enum class TALSynonymsError { noFile = 1001 };

// Which words mean the same, from a text file, and what that does for a query.
//
// The file has one entry a line: a headword and its synonyms, separated by commas. A word may hold
// blanks; it is lowercased, and blanks and tabs around it go. One with a digit or any punctuation
// but comma and blank is left out, and with the headword its line. Of several lines for a headword
// the first counts. A synonym is no headword unless it has a line of its own. There are no comments
// and no quotes. Lines end as Unicode has it; the encoding is detected.
//
// Threads: load first; then any.
class TALSynonyms {
 public:
  // A cleaned headword (UTF-8) and its cleaned synonyms, in the order of the file, none twice.
  using Vocab = std::unordered_map<std::string, std::vector<std::string>>;

  // A larger file is an error: the lists stay in memory, once for each protection class. A hundred
  // times the size of the shipped one.
  static constexpr size_t kMaximumFileSize = size_t{4} << 20;  // bytes

  void setSynonymVocab(Vocab vocab) { _vocab = std::move(vocab); }

  // The synonyms of exactly that word; null for none. Lives until the next load.
  [[nodiscard]] const std::vector<std::string>* synonyms(std::string_view word) const;

  // Replaces all synonyms. After false, with a line in the log, they are what they were; for an
  // empty file the error is not set then.
  bool loadSynonymsFromFile(const std::string& path, TLErrorOut error);

  // For a query in which exactly one whole word was found in no document: fills `expandedTerms`
  // with the terms, that word as the one of its synonyms that gives the query the best score, and
  // returns that score. -1 when nothing is to be changed; `expandedTerms` means nothing then.
  // Searches once for each synonym, and once more for those that occur.
  [[nodiscard]] float synonymExpansion(const std::vector<saltsearch::Term>& terms,
                                       std::vector<saltsearch::Term>& expandedTerms,
                                       const salt::Index& withTextStore) const;

  // Each synonym of the word with what it is worth, in the order of the file.
  [[nodiscard]] std::vector<std::pair<std::string, float>> getSynonymsScores(
      std::string_view word) const;

  static const platform::Log& log();

 private:
  struct Best {
    std::string synonym;
    float score;
  };

  [[nodiscard]] static bool _doNotExpand(const saltsearch::Term& term);
  // Index of the one term to expand, or the number of terms.
  [[nodiscard]] static size_t targetOf(const std::vector<saltsearch::Term>& terms);
  // Those that some document has in place of the target's first token, each with a blank behind.
  [[nodiscard]] static std::vector<std::string> presentSynonyms(
      const saltsearch::Term& target, const std::vector<std::string>& synonyms,
      const salt::Index& textStore);
  // Leaves the last one tried in `terms`.
  [[nodiscard]] static Best bestSynonym(const std::vector<std::string>& present, size_t target,
                                        std::vector<saltsearch::Term>& terms,
                                        const salt::Index& textStore);

  Vocab _vocab;
};
