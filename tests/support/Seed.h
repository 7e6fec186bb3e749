#pragma once

#include <cstdint>
#include <cstdlib>

namespace testsupport {

// Where the seeds of random tests begin: TALLOW_TEST_SEED, 1 unless set.
inline uint32_t firstSeed() {
  const char* text = std::getenv("TALLOW_TEST_SEED");
  return text != nullptr ? static_cast<uint32_t>(std::strtoul(text, nullptr, 10)) : 1;
}

}  // namespace testsupport
