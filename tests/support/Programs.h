#pragma once

#include <gtest/gtest.h>

#include <initializer_list>
#include <string>

namespace testsupport {

// What a shell command writes to its standard output.
[[nodiscard]] std::string outputOf(const std::string& command);

// The first of these programs, by name or path, that is not installed; empty if all are.
[[nodiscard]] std::string missingProgram(std::initializer_list<const char*> programs);
[[nodiscard]] bool isCI();

}  // namespace testsupport

// Skips a test that lacks one of these programs, or fails it with CI=true: scripts/ci-packages.list
// has them all.
#define NEED_PROGRAMS(...)                                                                 \
  if (const auto missing = testsupport::missingProgram({__VA_ARGS__}); !missing.empty()) { \
    ASSERT_FALSE(testsupport::isCI()) << missing << " is missing";                         \
    GTEST_SKIP() << missing << " is not installed";                                        \
  }
