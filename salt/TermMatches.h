#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <vector>

#include "salt/DocPages.h"
#include "salt/PostingSet.h"
#include "salt/Search.h"
#include "salt/ZoneMask.h"

namespace saltsearch {

// The documents that the tokens of one term match, and the zones of the term in which they match.
// Answers from what scans have found, so that only the documents asked for cost anything. One
// thread; the index outlives it.
class TermMatches {
 public:
  // What scans for the tokens have found; null where only ScanPrefix can tell.
  using Found = std::vector<std::shared_ptr<const salt::FoundPlaces>>;

  // Takes what was found for a well-formed term and sets Term::found. Takes at most `maxSuffixes`
  // suffixes over all tokens.
  TermMatches(const salt::Index& index, Term& term, Found found, size_t maxSuffixes);
  // Scans for the tokens first.
  TermMatches(const salt::Index& index, Term& term, size_t maxSuffixes);

  // The number of suffixes taken.
  [[nodiscard]] size_t suffixes() const { return _suffixes; }

  // The zone mask (see ZoneBits) of a token's match in a document, 0 where it does not match.
  [[nodiscard]] uint32_t mask(size_t token, uint32_t docID) const {
    const Token& of = _tokens[token];
    return of.found ? _zones.of(of.found->mask(docID)) : of.masks.at(docID);
  }
  // The number of pages of documents up to the last one with a match; see DocPages.
  [[nodiscard]] size_t pages() const;
  // Sets `out` to something other than 0 for the documents of the page that any token matches, and
  // to 0 for the others. False when there is certainly no match.
  [[nodiscard]] bool matchPage(size_t page, salt::MaskPage* out) const;

  // Calls visit(docID, mask) for each document of each token, once for a token.
  template <typename Visit>
  void forEach(const Visit& visit) const {
    for (const Token& token : _tokens) {
      if (token.found) {
        token.found->forEach([&](uint32_t docID, uint32_t found) {
          if (const uint32_t mask = _zones.of(found); mask != 0) visit(docID, mask);
        });
      } else {
        token.masks.forEach([&visit](uint32_t docID, uint32_t mask) {
          if (mask != 0) visit(docID, mask);
        });
      }
    }
  }

 private:
  struct Token {
    std::shared_ptr<const salt::FoundPlaces> found;  // null when the masks are in `masks`
    salt::DocPages<uint32_t> masks;
  };

  std::vector<Token> _tokens;
  mutable salt::ZoneMaskMap _zones;  // from what was found to the zones of the term
  size_t _suffixes = 0;
};

// Sets Term::found as TermMatches does, stopping at the first suffix.
void setFound(const salt::Index& index, Term& term);

}  // namespace saltsearch
