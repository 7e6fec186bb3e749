#include "salt/Alternatives.h"

namespace saltsearch {

std::vector<bool> AnyDocument(const salt::Index& index, const Term& term,
                              const std::vector<std::string>& tokens, size_t maxSuffixes) {
  std::vector<bool> any;
  std::vector<Term> terms{term};
  for (const std::string& token : tokens) {
    terms[0].tokens[0] = token;
    any.push_back(!Search(index, terms, {1, maxSuffixes, 0}).empty());
  }
  return any;
}

std::vector<std::optional<double>> BestScores(const salt::Index& index,
                                              const std::vector<Term>& terms, size_t position,
                                              const std::vector<std::string>& tokens,
                                              const Options& options) {
  std::vector<std::optional<double>> best;
  std::vector<Term> changed = terms;
  changed[position].tokenScores[0] = 1.0;
  for (const std::string& token : tokens) {
    changed[position].tokens[0] = token;
    const auto results = Search(index, changed, options);
    best.push_back(results.empty() ? std::nullopt : std::optional(results[0].score));
  }
  return best;
}

}  // namespace saltsearch
