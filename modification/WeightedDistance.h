#pragma once

#include <string_view>

// The cost of a mistake by its position in the typed word: one minus a score of its likelihood.
// Mistakes at the start of a word are rare and so cost more.
inline constexpr float cDelStart = 0.39999998F;  // the typed word has an extra letter
inline constexpr float cDelMid = 0.27999997F;
inline constexpr float cDelEnd = 0.20999998F;
inline constexpr float cInsStart = 0.44999998F;  // the typed word lacks a letter
inline constexpr float cInsMid = 0.18F;
inline constexpr float cInsEnd = 0.25F;
inline constexpr float cSubStart = 0.26999998F;  // a different letter
inline constexpr float cSubMid = 0.19999998F;
inline constexpr float cSubEnd = 0.19F;
inline constexpr float cSwapStart = 0.38999998F;  // two neighbouring letters exchanged
inline constexpr float cSwapMid = 0.3F;
inline constexpr float cSwapEnd = 0.38F;

// The cost of the mistakes that turn `strB` into the typed word `strA`, bytewise: a restricted
// Damerau-Levenshtein distance with the costs above, not symmetric. Only cells within `maxDistance`
// of the diagonal are computed, as in the banded variant of Ukkonen's algorithm, and the start and
// end within a row are those of the band. Returns `maxDistance` if the lengths differ by more or
// the cost exceeds `maxWeightedDistance`.
[[nodiscard]] float weightedDistance(std::string_view strA, std::string_view strB,
                                     float maxDistance, float maxWeightedDistance);
