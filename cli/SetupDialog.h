#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "cli/MailFinder.h"

namespace cli {

// The places as numbered lines, clean for a terminal.
[[nodiscard]] std::string placesText(const std::vector<MailPlace>& places);

// Reads an answer: numbers from 1, "all" or "none"; the empty answer is all if `allByDefault`, else
// none. The chosen indices, sorted; nullopt if it is no answer.
[[nodiscard]] std::optional<std::vector<size_t>> parseChoice(std::string_view answer, size_t count,
                                                             bool allByDefault);

// Asks on the terminal which places to take. Nullopt after an end of input or too many answers that
// are none.
[[nodiscard]] std::optional<std::vector<std::string>> askWhich(const std::vector<MailPlace>& places,
                                                               bool allByDefault);

}  // namespace cli
