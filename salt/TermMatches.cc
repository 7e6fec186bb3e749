#include "salt/TermMatches.h"

#include <utility>

#include "salt/TermRules.h"

namespace saltsearch {

namespace {

// The places of the first `maxSuffixes` suffixes over all tokens. Sets Term::found.
TermMatches::Found firstSuffixes(const salt::Index& index, Term& term, size_t maxSuffixes) {
  const auto none = std::make_shared<const salt::PostingSet>();
  TermMatches::Found found;
  size_t suffixes = 0;
  for (const std::string& token : term.tokens) {
    const auto places = std::make_shared<salt::PostingSet>();
    index.ScanPrefix(token, [&](const salt::SuffixMeta& meta) {
      term.found = true;
      if (suffixes == maxSuffixes) return false;
      ++suffixes;
      places->add({meta.DocID, meta.ZoneID});
      return true;
    });
    found.push_back(std::make_shared<const salt::FoundPlaces>(places, none));
  }
  return found;
}

}  // namespace

TermMatches::TermMatches(const salt::Index& index, Term& term, size_t maxSuffixes)
    : TermMatches(index, term,
                  index.ScanPlaces({term.tokens.begin(), term.tokens.end()}, maxSuffixes),
                  maxSuffixes) {}

TermMatches::TermMatches(const salt::Index& index, Term& term, Found found, size_t maxSuffixes)
    : _found(std::move(found)), _parts(term.tokens.size()) {
  size_t left = maxSuffixes;
  const bool all = std::all_of(_found.begin(), _found.end(), [&left](const auto& places) {
    if (places == nullptr || places->suffixes() > left) return false;
    left -= places->suffixes();
    return true;
  });
  if (!all) _found = firstSuffixes(index, term, maxSuffixes);
  const ZoneBits zoneBits(term.zones);
  for (size_t t = 0; t < term.tokens.size(); ++t) {
    if (!_found[t]->empty()) term.found = true;
    _found[t]->forEachZone([&](uint16_t zone, const salt::DocSet& docs) {
      if (const uint32_t mask = zoneBits.of(zone); mask != 0) _parts[t].push_back({&docs, mask});
    });
  }
}

size_t TermMatches::pages() const {
  size_t count = 0;
  for (const auto& parts : _parts) {
    for (const Part& part : parts) count = std::max(count, part.docs->pages());
  }
  return count;
}

void TermMatches::addPage(size_t page, salt::DocPage* docs) const {
  for (const auto& parts : _parts) {
    for (const Part& part : parts) {
      if (const salt::DocPage* const more = part.docs->page(page); more != nullptr) *docs |= *more;
    }
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
