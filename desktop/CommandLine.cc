#include "desktop/CommandLine.h"

#include <fmt/format.h>

#include <cstdio>
#include <string_view>

namespace desktop {

std::optional<int> answerCommandLine(int argc, char** argv, const char* program, const char* help) {
  if (argc < 2) return std::nullopt;
  const std::string_view argument = argv[1];
  if (argc == 2 && argument == "--help") {
    fmt::print("Usage: {} [--help | --version]\n\n{}", program, help);
    return 0;
  }
  if (argc == 2 && argument == "--version") {
    fmt::print("{} {}\n", program, TALLOW_VERSION);
    return 0;
  }
  fmt::print(stderr, "{}: takes no arguments but --help and --version\n", program);
  return 2;
}

}  // namespace desktop
