#pragma once

#include <cstddef>
#include <optional>
#include <vector>

#include "salt/DocSet.h"
#include "salt/Search.h"
#include "salt/TermMatches.h"
#include "salt/TermRules.h"

namespace saltsearch {

// Selects the documents that can still enter a full list of results, a page at a time and without
// looking at single documents. Most documents of a frequent word have it in their body alone, and
// so score too low once the list is full.
//
// For each term, the *plain* documents are those that match a required term in one zone of little
// weight, and those that do not match any other term. One bound of the score holds for all
// documents that are plain for each term, and another for those that are plain for each term but a
// given one. Where a bound is too low, these documents are not selected.
//
// The factors of all terms must be finite and not negative. Bounds are multiplied in the order of
// the terms, as scores are, so that they remain bounds after rounding. One thread; terms and
// matches outlive it.
class Contenders {
 public:
  // `matches` has the matches of each term that is not skipped.
  Contenders(const Evaluation& evaluation, const std::vector<Term>& terms,
             const std::vector<std::optional<TermMatches>>& matches);

  // Sets the score to exceed. False when no document can.
  [[nodiscard]] bool exceed(double score);

  // The documents among `docs`, of a page, that may exceed the score. All of `docs` match the
  // required terms.
  [[nodiscard]] salt::DocPage select(size_t page, const salt::DocPage& docs) const;

 private:
  struct Level {
    double plain = 0;      // the highest factor of a plain document
    double best = 0;       // of any document
    bool decides = false;  // a document that is plain for all other terms may exceed the score
    std::vector<const salt::DocSet*> light;  // a document in one of these alone is plain
    std::vector<const salt::DocSet*> heavy;  // a document in one of these is not
  };

  [[nodiscard]] static Level levelOf(const Term& term, const TermMatches& matches, bool required);
  [[nodiscard]] static salt::DocPage notPlain(const Level& level, size_t page);

  std::vector<Level> _levels;
  std::optional<double> _score;
  bool _plainMayExceed = true;  // documents that are plain for all terms
  bool _anyMayExceed = true;
};

}  // namespace saltsearch
