#pragma once

#include <algorithm>
#include <chrono>
#include <cstddef>
#include <optional>

namespace cli {

// Chooses the number of items per call so that a call keeps the daemon busy for about 50 ms, which
// is how long a search may have to wait for it.
//
// A reply may also be late because the daemon waited for something else, mostly a merge. So the
// time per item follows the quickest replies: a quicker reply counts at once, a slower one raises
// the estimate by a tenth.
class BatchPace {
 public:
  static constexpr std::chrono::milliseconds kWork{50};
  static constexpr size_t kFirst = 20;  // before the first reply
  static constexpr size_t kMin = 5;
  static constexpr size_t kMax = 500;

  [[nodiscard]] size_t items() const {
    if (!_perItem) return kFirst;
    return std::clamp(static_cast<size_t>(Seconds(kWork) / *_perItem), kMin, kMax);
  }

  void replied(size_t items, std::chrono::nanoseconds took) {
    if (items == 0) return;
    const Seconds seen = std::max<Seconds>(Seconds(took) / static_cast<double>(items), kMinPerItem);
    _perItem = _perItem ? std::min(seen, *_perItem * kRise) : seen;
  }

 private:
  using Seconds = std::chrono::duration<double>;

  static constexpr double kRise = 1.1;
  static constexpr Seconds kMinPerItem{1e-6};

  std::optional<Seconds> _perItem;
};

}  // namespace cli
