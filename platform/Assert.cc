#include "platform/Assert.h"

#include <cstdio>
#include <cstdlib>

namespace platform {

void assertionFailed(const char* expression, const char* file, int line) {
  std::fprintf(stderr, "Assertion failed: %s, %s:%d\n", expression, file, line);
  std::abort();
}

}  // namespace platform
