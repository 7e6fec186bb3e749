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

// The score of a synonym relative to the query word, in the first pass of a search.
inline constexpr float kSynonymScore = 0.1F;

enum class TALSynonymsError { noFile = 1001 };

// Synonyms from a text file, and their use in queries.
//
// The file has one entry per line: a headword and its synonyms, separated by commas. A word may
// contain spaces; it is lowercased and trimmed of spaces and tabs. A word with a digit or
// punctuation is skipped, and with the headword the whole line is. If several lines have the same
// headword, the first counts. A synonym is a headword only on a line of its own. There are no
// comments and no quotes. Line ends are those of Unicode; the encoding is detected.
//
// Threads: load first; then any.
class TALSynonyms {
 public:
  // Cleaned headwords (UTF-8) with their cleaned synonyms, in file order without duplicates.
  using Vocab = std::unordered_map<std::string, std::vector<std::string>>;

  // A larger file is an error, because the synonyms stay in memory once per protection class. A
  // hundred times the size of the shipped file.
  static constexpr size_t kMaxFileBytes = size_t{4} << 20;

  void setSynonymVocab(Vocab vocab) { _vocab = std::move(vocab); }

  // The synonyms of exactly this word, null for none. Valid until the next load.
  [[nodiscard]] const std::vector<std::string>* synonyms(std::string_view word) const;

  // Replaces all synonyms. On failure, with a log line, they are unchanged; for an empty file the
  // error is not set.
  bool loadSynonymsFromFile(const std::string& path, TLErrorOut error);

  // For a query in which exactly one whole word matches no document: fills `expandedTerms` with the
  // terms, that word replaced by the synonym that gives the query its best score, and returns that
  // score. Returns -1 when nothing changes; `expandedTerms` is unspecified then. Searches once for
  // each synonym, and once more for those that occur in the index.
  [[nodiscard]] float synonymExpansion(const std::vector<saltsearch::Term>& terms,
                                       std::vector<saltsearch::Term>& expandedTerms,
                                       const salt::Index& withTextStore) const;

  // Each synonym of the word with its score, in file order.
  [[nodiscard]] std::vector<std::pair<std::string, float>> getSynonymsScores(
      std::string_view word) const;

  static const platform::Log& log();

 private:
  struct Best {
    std::string synonym;
    float score;
  };

  [[nodiscard]] static bool _doNotExpand(const saltsearch::Term& term);
  // The index of the one term to expand, or the number of terms.
  [[nodiscard]] static size_t targetOf(const std::vector<saltsearch::Term>& terms);
  // The synonyms for which some document matches the target term, each with a trailing space.
  [[nodiscard]] static std::vector<std::string> presentSynonyms(
      const saltsearch::Term& target, const std::vector<std::string>& synonyms,
      const salt::Index& textStore);
  // `terms` is left with the last synonym tried.
  [[nodiscard]] static Best bestSynonym(const std::vector<std::string>& present, size_t target,
                                        std::vector<saltsearch::Term>& terms,
                                        const salt::Index& textStore);

  Vocab _vocab;
};
