#pragma once

#include <string>
#include <vector>

#include "cli/StatusFacts.h"

namespace cli {

// The status as one page for browsers, which needs no script and loads nothing: mails by folder,
// month and year, the size of the index and its search times over the measured days, merges, and
// failures by reason. `now` is in seconds since 1970.
[[nodiscard]] std::string statusPage(const std::vector<ClassStatus>& classes,
                                     const std::string& lock, double now);

}  // namespace cli
