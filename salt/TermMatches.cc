#include "salt/TermMatches.h"

#include <algorithm>
#include <utility>

#include "salt/TermRules.h"

namespace saltsearch {

namespace {

// The bits of the zones of a term for those of masks that were found.
salt::ZoneMaskMap zoneMap(const ZoneBits& bits, const TermMatches::Found& found) {
  std::vector<uint16_t> zones;
  for (const auto& places : found) {
    if (places != nullptr) zones = places->zones();  // the table only grows
  }
  return {zones, [&bits](uint16_t zone) { return bits.of(zone); }};
}

}  // namespace

TermMatches::TermMatches(const salt::Index& index, Term& term, size_t maxSuffixes)
    : TermMatches(index, term,
                  index.ScanPlaces({term.tokens.begin(), term.tokens.end()}, maxSuffixes),
                  maxSuffixes) {}

TermMatches::TermMatches(const salt::Index& index, Term& term, Found found, size_t maxSuffixes)
    : _tokens(term.tokens.size()), _zones(zoneMap(ZoneBits(term.zones), found)) {
  const ZoneBits zoneBits(term.zones);
  for (size_t t = 0; t < term.tokens.size(); ++t) {
    Token& token = _tokens[t];
    const size_t left = maxSuffixes - _suffixes;
    if (found[t] != nullptr && found[t]->hasAllInMasks() && found[t]->suffixes() <= left) {
      token.found = std::move(found[t]);
      _suffixes += token.found->suffixes();
      continue;
    }
    index.ScanPrefix(term.tokens[t], [&](const salt::SuffixMeta& meta) {
      term.found = true;
      if (_suffixes == maxSuffixes) return false;
      ++_suffixes;
      const uint32_t bits = zoneBits.of(meta.ZoneID);
      if (bits != 0) token.masks[meta.DocID] |= bits;
      return true;
    });
  }
  term.found = term.found || _suffixes != 0;
}

size_t TermMatches::pages() const {
  size_t count = 0;
  for (const Token& token : _tokens) {
    count = std::max(count, token.found ? token.found->pages() : token.masks.pages());
  }
  return count;
}

bool TermMatches::matchPage(size_t page, salt::MaskPage* out) const {
  out->fill(0);
  bool some = false;
  for (const Token& token : _tokens) {
    if (token.found) {
      some = token.found->addPage(page, _zones.effective(), out) || some;
    } else if (const uint32_t* const masks = token.masks.page(page); masks != nullptr) {
      some = true;
      for (size_t i = 0; i < out->size(); ++i) (*out)[i] |= masks[i];
    }
  }
  return some;
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
