#pragma once

#include <chrono>

namespace salt {

class Activity;

// Has a merge give way to scans: while some run it waits, up to three times as long as it has
// computed. A merge is in no hurry, and what it computes beside a search it takes from the search.
// One thread, that of the merge.
class MergePace {
 public:
  explicit MergePace(Activity& scans);

  // To be called again and again, where the merge holds nothing that others wait for.
  void giveWay();

 private:
  Activity& _scans;
  std::chrono::nanoseconds _computed;  // the thread's, as far as _credit has it
  std::chrono::nanoseconds _credit{0};
};

}  // namespace salt
