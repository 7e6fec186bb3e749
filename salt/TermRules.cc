#include "salt/TermRules.h"

#include <algorithm>

#include "salt/Database.h"

namespace saltsearch {

namespace {

double cappedSum(const std::vector<double>& weights) {
  double sum = 0;
  for (const double weight : weights) sum += weight;
  return std::min(sum, 1.0);
}

}  // namespace

bool wellFormed(const Term& term) {
  if (term.tokens.size() != term.tokenScores.size()) {
    salt::Log.error("Mismatched tokens in query.");
    return false;
  }
  if (term.zones.size() != term.zoneScores.size()) {
    salt::Log.error("Mismatched zones in query.");
    return false;
  }
  if (term.zones.size() > kMaxTermZones) {
    salt::Log.error("Too many zones in query: {}.", term.zones.size());
    return false;
  }
  return true;
}

Bounds boundsOf(const std::vector<Term>& terms) {
  const size_t n = terms.size();
  Bounds bounds{std::vector<double>(n), std::vector<double>(n + 1), std::vector<double>(n + 1)};
  bounds.matched[n] = 0;
  bounds.any[n] = 1;
  for (size_t i = n; i-- > 0;) {
    const Term& term = terms[i];
    bounds.zone[i] = term.zones.empty() ? 1.0 : cappedSum(term.zoneScores);
    double best = 0;
    for (const double score : term.tokenScores) best = std::max(best, score);
    best *= bounds.zone[i];
    bounds.any[i] = std::max(term.defaultScore, best) * bounds.any[i + 1];
    bounds.matched[i] =
        std::max(term.defaultScore * bounds.matched[i + 1], best * bounds.any[i + 1]);
  }
  return bounds;
}

ZoneBits::ZoneBits(const std::vector<uint16_t>& zones) {
  if (zones.empty()) _others = 1;
  for (size_t i = 0; i < zones.size(); ++i) {
    const uint32_t bit = uint32_t{1} << i;
    if (zones[i] == 0) _others = bit;  // the last entry of this kind stands for all not listed
    if (zones[i] >= _bits.size()) _bits.resize(zones[i] + size_t{1});
    if (_bits[zones[i]] == 0) _bits[zones[i]] = bit;
  }
}

double zoneFactor(const Term& term, uint32_t zoneMask) {
  if (term.zones.empty()) return 1.0;
  double sum = 0;
  for (size_t i = 0; i < term.zones.size(); ++i) {
    if ((zoneMask >> i & 1) != 0) sum += term.zoneScores[i];
  }
  return std::min(sum, 1.0);
}

double factorOf(const Term& term, const DocResult& doc) {
  if (doc.tokenScore == -1.0) return term.defaultScore;
  return doc.tokenScore * zoneFactor(term, doc.zoneMask);
}

}  // namespace saltsearch
