#pragma once

#include <string_view>

// What a mistake costs, by where in the typed word it is: one minus a score that says how likely it
// is there. Mistakes at the start of a word are rare and so cost more.
inline constexpr float cDelStart = 0.39999998F;  // the typed word has a letter too many
inline constexpr float cDelMid = 0.27999997F;
inline constexpr float cDelEnd = 0.20999998F;
inline constexpr float cInsStart = 0.44999998F;  // the typed word lacks a letter
inline constexpr float cInsMid = 0.18F;
inline constexpr float cInsEnd = 0.25F;
inline constexpr float cSubStart = 0.26999998F;  // another letter
inline constexpr float cSubMid = 0.19999998F;
inline constexpr float cSubEnd = 0.19F;
inline constexpr float cSwapStart = 0.38999998F;  // two neighbours exchanged
inline constexpr float cSwapMid = 0.3F;
inline constexpr float cSwapEnd = 0.38F;

// The cost of the mistakes that make the typed word `strA` out of `strB`, over bytes: a restricted
// Damerau-Levenshtein distance with the costs above, not symmetric. Only cells within `maxDistance`
// of the diagonal are looked at, as in the banded variant of Ukkonen's algorithm, and start and end
// within a row are those of the band. `maxDistance` where the lengths differ by more, or the cost
// exceeds `maxWeightedDistance`.
[[nodiscard]] float weightedDistance(std::string_view strA, std::string_view strB,
                                     float maxDistance, float maxWeightedDistance);
