#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <vector>

#include "salt/Index.h"
#include "salt/Search.h"

// Hundreds of searches that differ in one word, for the cost of a few.
namespace saltsearch {

// For each token: whether Search for the one term, that token in place of its first, with at most
// `maxSuffixes` suffixes and the threshold 0, finds a document. Calls must not overlap with changes
// of `term`; beside all else, on the calling thread.
[[nodiscard]] std::vector<bool> AnyDocument(const salt::Index& index, const Term& term,
                                            const std::vector<std::string>& tokens,
                                            size_t maxSuffixes);

// For each token: the highest score of Search for the terms, that token with the score 1 in place
// of the first of the term at `position`; none where nothing is found. `options.maxResults` is at
// least 1.
[[nodiscard]] std::vector<std::optional<double>> BestScores(const salt::Index& index,
                                                            const std::vector<Term>& terms,
                                                            size_t position,
                                                            const std::vector<std::string>& tokens,
                                                            const Options& options);

}  // namespace saltsearch
