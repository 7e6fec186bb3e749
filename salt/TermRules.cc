#include "salt/TermRules.h"

#include <algorithm>
#include <bit>
#include <cmath>

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
    if (zones[i] == 0) _others = bit;  // the last such entry stands for all zones not listed
    if (zones[i] >= _bits.size()) _bits.resize(zones[i] + size_t{1});
    if (_bits[zones[i]] == 0) _bits[zones[i]] = bit;
  }
}

double zoneFactor(const Term& term, uint32_t zoneMask) {
  if (term.zones.empty()) return 1.0;
  double sum = 0;
  for (; zoneMask != 0; zoneMask &= zoneMask - 1) {
    sum += term.zoneScores[static_cast<size_t>(std::countr_zero(zoneMask))];
  }
  return std::min(sum, 1.0);
}

namespace {

// Whether a document that this token is the first to match stays below the threshold, even if a
// later token of the term raises its score.
bool refusesNewDocs(const Term& term, size_t token, double unmatched, double zoneBound,
                    double need) {
  double best = term.tokenScores[token];
  if (term.isMin || term.zones.size() > 1) {
    best = *std::max_element(term.tokenScores.begin() + static_cast<ptrdiff_t>(token),
                             term.tokenScores.end());
  }
  return unmatched * best * zoneBound < need;
}

// Whether all scores are finite and not negative: then a factor of 0 makes a product 0.
bool zeroEndsAll(const std::vector<Term>& terms, double any) {
  const auto fits = [](double value) { return value >= 0 && std::isfinite(value); };
  double most = 1;
  for (const Term& term : terms) {
    double best = std::max(1.0, term.defaultScore);
    for (const double score : term.tokenScores) {
      if (!fits(score)) return false;
      best = std::max(best, score);
    }
    if (!fits(term.defaultScore) ||
        !std::all_of(term.zoneScores.begin(), term.zoneScores.end(), fits)) {
      return false;
    }
    most *= best;
  }
  return std::isfinite(most) && std::isfinite(any);
}

}  // namespace

Evaluation::Evaluation(const std::vector<Term>& terms, const Options& options)
    : _terms(terms), _options(options), _steps(terms.size()) {
  const Bounds bounds = boundsOf(terms);
  const bool zeroEnds = options.threshold > 0 && zeroEndsAll(terms, bounds.any[0]);
  double unmatched = 1.0;
  for (size_t u = 0; u < terms.size(); ++u) {
    const Term& term = terms[u];
    Step& step = _steps[u];
    step.skipped = !wellFormed(term);
    if (step.skipped) continue;
    step.required = zeroEnds && term.defaultScore == 0;
    step.unmatched = unmatched;
    unmatched *= term.defaultScore;
    const double reach = unmatched * bounds.matched[u + 1];
    step.prunes = reach < options.threshold;
    step.need = options.threshold / bounds.any[u + 1];
    step.refuses.resize(term.tokens.size());
    step.admitsNobody = true;
    for (size_t t = 0; t < term.tokens.size(); ++t) {
      step.refuses[t] = !(options.threshold <= reach) &&
                        refusesNewDocs(term, t, step.unmatched, bounds.zone[u], step.need);
      if (!step.refuses[t]) step.admitsNobody = false;
    }
  }
}

}  // namespace saltsearch
