#include "tests/modification/ModificationSupport.h"

#include "tests/salt/SaltSupport.h"

namespace testsupport {

saltsearch::Term word(const std::string& token) {
  saltsearch::Term term;
  term.tokens = {token};
  term.tokenScores = {1.0};
  term.zones = {13, 171};
  term.zoneScores = {0.9, 0.5};
  term.isUnigram = true;
  return term;
}

std::string tokensOf(const std::vector<saltsearch::Term>& terms) {
  std::string out;
  for (const auto& term : terms) out += '[' + term.tokens.at(0) + ']';
  return out;
}

Corpus::Corpus(const std::vector<std::string>& texts)
    : index(salttest::newIndex(directory / "salt")) {
  uint32_t docID = 0;
  for (const auto& text : texts)
    salttest::addZone(*index, ++docID, 13, text, salttest::wordOffsets(text));
}

std::vector<saltsearch::Term> Corpus::searched(std::vector<saltsearch::Term> terms) const {
  static_cast<void>(saltsearch::Search(*index, terms, {1000, 1000, 0.02}));
  return terms;
}

}  // namespace testsupport
