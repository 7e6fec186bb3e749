#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "salt/DocPages.h"
#include "salt/Search.h"

namespace saltsearch {

// The documents that the tokens of one term match, and in which of the term's zones. Memory: 4
// bytes for each document, and its neighbours, that a token matches. One thread.
class TermMatches {
 public:
  // Scans for all tokens of a well-formed term and sets Term::found. Takes at most `maxSuffixes`
  // suffixes over all tokens, and of documents only those that are true in `wanted`: all of them
  // without it.
  TermMatches(const salt::Index& index, Term& term, size_t maxSuffixes,
              const salt::DocPages<bool>* wanted);

  // The zone mask, see ZoneBits, of a document by token, 0 where the token does not match.
  [[nodiscard]] uint32_t mask(size_t token, uint32_t docID) const {
    return _masks[token].at(docID);
  }

  // Calls visit(docID, mask) for each document of each token, in order within the token.
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

// Sets Term::found as the scans of TermMatches do, at the cost of a first suffix.
void setFound(const salt::Index& index, Term& term);

}  // namespace saltsearch
