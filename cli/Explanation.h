#pragma once

#include <nlohmann/json_fwd.hpp>
#include <string>
#include <vector>

#include "cli/QueryInput.h"
#include "cli/Terminal.h"
#include "query/TALTerm.h"

namespace cli {

// The terms that the daemon derives from the query, with the query's parameters over the defaults.
// Empty if there is no tokenizer.
[[nodiscard]] std::vector<TALTerm> termsOf(const TLQuery& query);
// The same for the queries of all branches, without their exclusions.
[[nodiscard]] std::vector<TALTerm> termsOf(const SearchPlan& plan);

// The output of `explain` without the results: each step from the expression to the terms.
[[nodiscard]] std::string explanationText(const QueryInput& input,
                                          const std::vector<TALTerm>& terms,
                                          const Palette& palette);
[[nodiscard]] nlohmann::json explanationJSON(const QueryInput& input,
                                             const std::vector<TALTerm>& terms);

}  // namespace cli
