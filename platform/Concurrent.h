#pragma once

#include <algorithm>
#include <cstddef>
#include <execution>
#include <numeric>
#include <vector>

namespace platform {

// Runs body(0) to body(count - 1) on the pool of the platform, in no order, and returns when all
// have ended. `body` must not throw.
template <typename Body>
void concurrentApply(size_t count, const Body& body) {
  if (count == 1) return body(size_t{0});
  std::vector<size_t> indices(count);
  std::iota(indices.begin(), indices.end(), size_t{0});
  std::for_each(std::execution::par, indices.begin(), indices.end(), body);
}

}  // namespace platform
