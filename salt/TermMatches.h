#pragma once

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <vector>

#include "salt/DocSet.h"
#include "salt/PostingSet.h"
#include "salt/Search.h"

namespace saltsearch {

// The documents that the tokens of one term match, and the zones of the term in which they match.
// Answers from what scans have found. One thread; the index outlives it.
class TermMatches {
 public:
  // What scans for the tokens have found; null where only ScanPrefix can tell.
  using Found = std::vector<std::shared_ptr<const salt::FoundPlaces>>;

  // The documents that a token matches in one zone of the index. A zone may have two such parts.
  struct Part {
    const salt::DocSet* docs;
    uint32_t mask;  // of the zones of the term; see ZoneBits
  };

  // Takes what was found for a well-formed term and sets Term::found. Takes at most `maxSuffixes`
  // suffixes over all tokens.
  TermMatches(const salt::Index& index, Term& term, Found found, size_t maxSuffixes);
  // Scans for the tokens first.
  TermMatches(const salt::Index& index, Term& term, size_t maxSuffixes);

  // By token.
  [[nodiscard]] const std::vector<std::vector<Part>>& parts() const { return _parts; }

  // The zone mask (see ZoneBits) of a token's match in a document, 0 where it does not match.
  [[nodiscard]] uint32_t mask(size_t token, uint32_t docID) const {
    uint32_t mask = 0;
    for (const Part& part : _parts[token]) {
      if (part.docs->contains(docID)) mask |= part.mask;
    }
    return mask;
  }

  // The number of pages of documents up to the last one with a match; see DocSet.
  [[nodiscard]] size_t pages() const;
  // Adds the documents of the page that any token matches.
  void addPage(size_t page, salt::DocPage* docs) const;
  // Calls visit(docID) for each document that any token matches, ascending.
  template <typename Visit>
  void forEach(const Visit& visit) const {
    for (size_t page = 0; page < pages(); ++page) {
      salt::DocPage docs;
      addPage(page, &docs);
      docs.forEach([&](size_t doc) { visit(salt::DocSet::docID(page, doc)); });
    }
  }

 private:
  Found _found;  // holds the documents of the parts
  std::vector<std::vector<Part>> _parts;
};

// Sets Term::found as TermMatches does, stopping at the first suffix.
void setFound(const salt::Index& index, Term& term);

}  // namespace saltsearch
