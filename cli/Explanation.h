#pragma once

#include <nlohmann/json_fwd.hpp>
#include <string>
#include <vector>

#include "cli/QueryInput.h"
#include "cli/Terminal.h"
#include "query/TALTerm.h"

namespace cli {

// The terms that the daemon makes of the query, under its parameters over the defaults. None where
// there is no tokenizer.
[[nodiscard]] std::vector<TALTerm> termsOf(const TLQuery& query);
// The same for the queries of all branches, but for what they leave out.
[[nodiscard]] std::vector<TALTerm> termsOf(const SearchPlan& plan);

// The output of explain, but for the results: each step from the expression to the terms.
[[nodiscard]] std::string explanationText(const QueryInput& input,
                                          const std::vector<TALTerm>& terms,
                                          const Palette& palette);
[[nodiscard]] nlohmann::json explanationJSON(const QueryInput& input,
                                             const std::vector<TALTerm>& terms);

}  // namespace cli
