#pragma once

#include <cstdint>
#include <vector>

#include "salt/Search.h"

// What the fields of terms mean to the score of a document: for all who evaluate queries.
namespace saltsearch {

// False, with a log line, for a term that is passed over.
[[nodiscard]] bool wellFormed(const Term& term);

// What the terms from one on can still multiply a document's score by, computed from the last term
// back. It is what lets a search drop documents early.
struct Bounds {
  std::vector<double> zone;     // of one term: sum of its zone weights, at most 1
  std::vector<double> matched;  // highest product if at least one of the terms really matches
  std::vector<double> any;      // highest product
};
[[nodiscard]] Bounds boundsOf(const std::vector<Term>& terms);

// The bit in a zone mask that a match in a zone sets, 0 when it does not count.
class ZoneBits {
 public:
  explicit ZoneBits(const std::vector<uint16_t>& zones);

  [[nodiscard]] uint32_t of(uint16_t zoneID) const {
    const uint32_t bit = zoneID < _bits.size() ? _bits[zoneID] : 0;
    return bit != 0 ? bit : _others;
  }

 private:
  std::vector<uint32_t> _bits;  // by zone
  uint32_t _others = 0;
};

// The summed weights, at most 1.0, of the term's zones in the mask.
[[nodiscard]] double zoneFactor(const Term& term, uint32_t zoneMask);

// What the term multiplies the score of a document by, from the document's working fields.
[[nodiscard]] double factorOf(const Term& term, const DocResult& doc);

}  // namespace saltsearch
