#pragma once

#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "salt/Search.h"

// Shared by everything that modifies the words of a query. A modification changes only the first
// token of a term and its score. A token with a trailing space is a whole word, one without is a
// prefix.
namespace modification {

// Whether the term stands for one word of a query and has a token to change.
[[nodiscard]] inline bool isSingleWord(const saltsearch::Term& term) {
  return term.isUnigram && !term.tokens.empty() && !term.tokenScores.empty();
}

// The token without its trailing space, if any.
[[nodiscard]] inline std::string_view withoutTrailingSpace(std::string_view token) {
  if (token.ends_with(' ')) token.remove_suffix(1);
  return token;
}

// The term must have a token and a score.
inline void setFirstToken(saltsearch::Term& term, std::string token) {
  term.tokens.front() = std::move(token);
  term.tokenScores.front() = 1.0;
}

// Whether any document matches the term. Reads one suffix per token.
[[nodiscard]] inline bool occurs(saltsearch::Term term, const salt::Index& textStore) {
  constexpr saltsearch::Options kOneMatch{.maxResults = 1, .maxSuffixes = 1, .threshold = 0};
  std::vector<saltsearch::Term> alone{std::move(term)};
  return !saltsearch::Search(textStore, alone, kOneMatch).empty();
}

}  // namespace modification
