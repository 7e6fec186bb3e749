#pragma once

#include <nlohmann/json.hpp>
#include <string>

#include "extract/Protocol.h"

namespace cli {

// For each kind of attachment a line with its outcomes, such as "pdf: 12 extracted, 1 encrypted".
// The first begins with `first`, the others with `next`.
[[nodiscard]] std::string attachmentText(const extract::Counts& counts, const std::string& first,
                                         const std::string& next);

// A list of {"type", "outcome", "count"}.
[[nodiscard]] nlohmann::json attachmentJSON(const extract::Counts& counts);

}  // namespace cli
