#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <vector>

#include "salt/Index.h"
#include "salt/Search.h"

// Evaluates hundreds of searches that differ in one word for the cost of a few.
namespace saltsearch {

// For each token: whether a search for this term alone finds a document, with the token in place of
// the term's first one, at most `maxSuffixes` suffixes and a threshold of 0. Runs on the calling
// thread, concurrently with everything except changes to `term`.
[[nodiscard]] std::vector<bool> AnyDocument(const salt::Index& index, const Term& term,
                                            const std::vector<std::string>& tokens,
                                            size_t maxSuffixes);

// For each token: the highest score that Search finds for the terms, with this token at score 1 in
// place of the first token of the term at `position`; nullopt when it finds nothing.
// `options.maxResults` must be at least 1.
[[nodiscard]] std::vector<std::optional<double>> BestScores(const salt::Index& index,
                                                            const std::vector<Term>& terms,
                                                            size_t position,
                                                            const std::vector<std::string>& tokens,
                                                            const Options& options);

}  // namespace saltsearch
