#include "salt/TermMatches.h"

#include <algorithm>

#include "salt/TermRules.h"
#include "salt/ZoneMask.h"

namespace saltsearch {

TermMatches::TermMatches(const salt::Index& index, Term& term, size_t maxSuffixes,
                         const salt::DocPages<bool>* wanted)
    : _masks(term.tokens.size()) {
  const ZoneBits zoneBits(term.zones);
  size_t suffixes = 0;
  for (size_t t = 0; t < term.tokens.size(); ++t) {
    Masks& masks = _masks[t];
    const auto take = [&](uint32_t docID, uint32_t bits) {
      if (bits != 0 && (wanted == nullptr || wanted->at(docID))) masks[docID] |= bits;
    };
    const size_t left = maxSuffixes - std::min(maxSuffixes, suffixes);
    const auto count = index.ScanPlaces(
        term.tokens[t], left, [&](const auto& zones, const auto* docs, size_t size) {
          salt::ZoneMaskMap bits(zones, [&](uint16_t zone) { return zoneBits.of(zone); });
          for (const salt::DocZones* doc = docs; doc != docs + size; ++doc) {
            take(doc->DocID, bits.of(doc->zones));
          }
        });
    if (count) {
      term.found = term.found || *count != 0;
      suffixes += *count;
      continue;
    }
    index.ScanPrefix(term.tokens[t], [&](const salt::SuffixMeta& meta) {
      term.found = true;
      if (++suffixes > maxSuffixes) return false;
      take(meta.DocID, zoneBits.of(meta.ZoneID));
      return true;
    });
  }
}

void setFound(const salt::Index& index, Term& term) {
  for (const std::string& token : term.tokens) {
    if (term.found) return;
    index.ScanPrefix(token, [&term](const salt::SuffixMeta&) {
      term.found = true;
      return false;
    });
  }
}

}  // namespace saltsearch
