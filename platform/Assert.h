#pragma once

namespace platform {

// Prints "Assertion failed: EXPRESSION, FILE:LINE" on the standard error and aborts.
[[noreturn]] void assertionFailed(const char* expression, const char* file, int line);

}  // namespace platform

// On in every build type: guards programming errors and corrupt data, never expected conditions.
#define TL_ASSERT(expression)          \
  ((expression) ? static_cast<void>(0) \
                : ::platform::assertionFailed(#expression, __FILE__, __LINE__))
