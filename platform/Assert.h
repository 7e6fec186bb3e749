#pragma once

namespace platform {

// Prints "Assertion failed: EXPRESSION, FILE:LINE" to standard error and aborts.
[[noreturn]] void assertionFailed(const char* expression, const char* file, int line);

}  // namespace platform

// Enabled in every build type. For programming errors and corrupt data, never for expected
// conditions.
#define TL_ASSERT(expression)          \
  ((expression) ? static_cast<void>(0) \
                : ::platform::assertionFailed(#expression, __FILE__, __LINE__))
