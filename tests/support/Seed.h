#pragma once

#include <cstdint>
#include <cstdlib>

namespace testsupport {

// The first seed of random tests: TALLOW_TEST_SEED, 1 if not set.
inline uint32_t firstSeed() {
  const char* text = std::getenv("TALLOW_TEST_SEED");
  return text != nullptr ? static_cast<uint32_t>(std::strtoul(text, nullptr, 10)) : 1;
}

}  // namespace testsupport
