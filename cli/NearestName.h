#pragma once

#include <string_view>

#include "modification/WeightedDistance.h"

namespace cli {

// The name in a table that a mistyped word most likely meant; null if every name is more than two
// mistakes away.
template <typename Rows>
[[nodiscard]] const char* nearestName(std::string_view word, const Rows& rows) {
  constexpr float kMaxMistakes = 2;
  float least = 0.6F;
  const char* nearest = nullptr;
  for (const auto& row : rows) {
    const float distance = weightedDistance(word, row.name, kMaxMistakes, 1);
    if (distance >= least) continue;
    least = distance;
    nearest = row.name;
  }
  return nearest;
}

}  // namespace cli
