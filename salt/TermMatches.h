#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "salt/DocPages.h"
#include "salt/Search.h"

namespace saltsearch {

// The documents that the tokens of one term match, and the zones of the term in which they match.
// Memory: 4 bytes for each matching document and its neighbours. One thread.
class TermMatches {
 public:
  // Scans for all tokens of a well-formed term and sets Term::found. Takes at most `maxSuffixes`
  // suffixes over all tokens, and only documents that are true in `wanted`, or all when it is null.
  TermMatches(const salt::Index& index, Term& term, size_t maxSuffixes,
              const salt::DocPages<bool>* wanted);

  // The zone mask (see ZoneBits) of a token's match in a document, 0 where it does not match.
  [[nodiscard]] uint32_t mask(size_t token, uint32_t docID) const {
    return _masks[token].at(docID);
  }

  // Calls visit(docID, mask) for each document of each token, in DocID order within the token.
  template <typename Visit>
  void forEach(const Visit& visit) const {
    for (const Masks& masks : _masks) {
      masks.forEach([&visit](uint32_t docID, uint32_t mask) {
        if (mask != 0) visit(docID, mask);
      });
    }
  }

 private:
  using Masks = salt::DocPages<uint32_t>;

  std::vector<Masks> _masks;  // by token
};

// Sets Term::found as the scans of TermMatches do, stopping at the first suffix.
void setFound(const salt::Index& index, Term& term);

}  // namespace saltsearch
