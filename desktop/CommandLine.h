#pragma once

#include <optional>

namespace desktop {

// Answers --help and --version; anything else is wrong use. Returns the exit status, or nullopt for
// a command line without arguments.
[[nodiscard]] std::optional<int> answerCommandLine(int argc, char** argv, const char* program,
                                                   const char* help);

}  // namespace desktop
