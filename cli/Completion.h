#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "cli/CompletionTable.h"

namespace cli {

// The script that completes the command line in a shell: bash, zsh or fish. Nullopt for another.
[[nodiscard]] std::optional<std::string> completionScript(const CompletionTable& table,
                                                          std::string_view shell);

}  // namespace cli
