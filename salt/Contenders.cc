#include "salt/Contenders.h"

#include <algorithm>
#include <map>
#include <utility>

namespace saltsearch {

namespace {

// The factor of the zone in which most documents match.
double commonFactor(const Term& term, const TermMatches& matches) {
  std::map<uint32_t, size_t> documents;  // by zone mask
  for (const auto& parts : matches.parts()) {
    for (const TermMatches::Part& part : parts) documents[part.mask] += part.docs->size();
  }
  const auto common = std::max_element(
      documents.begin(), documents.end(),
      [](const auto& left, const auto& right) { return left.second < right.second; });
  return common == documents.end() ? 0 : zoneFactor(term, common->first);
}

}  // namespace

Contenders::Contenders(const Evaluation& evaluation, const std::vector<Term>& terms,
                       const std::vector<std::optional<TermMatches>>& matches) {
  for (size_t u = 0; u < terms.size(); ++u) {
    if (evaluation.skips(u)) continue;
    _levels.push_back(levelOf(terms[u], *matches[u], evaluation.demandsMatch(u)));
  }
}

Contenders::Level Contenders::levelOf(const Term& term, const TermMatches& matches, bool required) {
  double score = 0;  // the highest of a token
  for (const double of : term.tokenScores) score = std::max(score, of);
  const uint32_t allZones = (uint32_t{1} << term.zones.size()) - 1;
  const double common = required ? commonFactor(term, matches) : -1;
  Level level;
  level.plain = required ? score * common : term.defaultScore;
  level.best = std::max(level.plain, score * zoneFactor(term, allZones));
  for (const auto& parts : matches.parts()) {
    for (const TermMatches::Part& part : parts) {
      (zoneFactor(term, part.mask) <= common ? level.light : level.heavy).push_back(part.docs);
    }
  }
  return level;
}

bool Contenders::exceed(double score) {
  if (std::exchange(_score, score) == score) return _anyMayExceed;
  // Whether documents that reach the best factor where `best` holds, and are plain elsewhere, may.
  const auto mayExceed = [this, score](const auto& best) {
    double bound = 1;
    for (const Level& level : _levels) bound *= best(level) ? level.best : level.plain;
    return bound > score;
  };
  _anyMayExceed = mayExceed([](const Level&) { return true; });
  _plainMayExceed = mayExceed([](const Level&) { return false; });
  for (Level& level : _levels) {
    level.decides = mayExceed([&level](const Level& other) { return &other == &level; });
  }
  return _anyMayExceed;
}

salt::DocPage Contenders::select(size_t page, const salt::DocPage& docs) const {
  if (_plainMayExceed) return docs;
  salt::DocPage once;  // not plain for a term
  salt::DocPage may;   // not plain for one that decides, or for two
  for (const Level& level : _levels) {
    const salt::DocPage those = notPlain(level, page);
    may |= level.decides ? those : once & those;
    once |= those;
  }
  return may &= docs;
}

salt::DocPage Contenders::notPlain(const Level& level, size_t page) {
  salt::DocPage once;
  salt::DocPage those;
  for (const salt::DocSet* const set : level.light) {
    const salt::DocPage* const docs = set->page(page);
    if (docs == nullptr) continue;
    those |= once & *docs;
    once |= *docs;
  }
  for (const salt::DocSet* const set : level.heavy) {
    if (const salt::DocPage* const docs = set->page(page); docs != nullptr) those |= *docs;
  }
  return those;
}

}  // namespace saltsearch
