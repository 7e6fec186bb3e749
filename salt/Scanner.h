#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "salt/Index.h"
#include "salt/PostingSet.h"
#include "salt/ScanCache.h"
#include "salt/TwoThreadRunner.h"

namespace salt {

class index;
class IndexView;

// Prefix scans over an index, each on a view of its own. Any thread. The index outlives it.
class Scanner {
 public:
  // Threads of one scan through the pages. A device has more processors, but during a search it
  // also indexes, and displays what was found.
  static constexpr size_t kThreads = 2;

  // The counts that one scan adds to the metrics.
  struct Counts {
    uint64_t results = 0;
    uint64_t fetches = 0;
    uint64_t hotReads = 0;
    uint64_t pageReads = 0;

    Counts& operator+=(const Counts& other);
  };

  explicit Scanner(const index& owner) : _idx(owner) {}

  // See the operations of Index with these names.
  void scanPrefix(std::string_view prefix,
                  const std::function<bool(const SuffixMeta&)>& callback) const;
  [[nodiscard]] std::vector<std::shared_ptr<const FoundPlaces>> scanPlaces(
      const std::vector<std::string_view>& prefixes, uint64_t limit) const;
  [[nodiscard]] std::vector<std::vector<SuffixMeta>> scanPrefixes(
      const std::vector<std::string>& prefixes, size_t limit) const;

 private:
  using Clock = std::chrono::steady_clock;

  // Runs part(0) and, where a second thread is worth waking, part(1) concurrently.
  void runParts(const IndexView& view, unsigned shards,
                const std::function<void(size_t part)>& part) const;
  // Starts the build of the Bloom filter from the stored texts.
  void learnStarts() const;

  const index& _idx;
  mutable ScanCache _scanCache;  // thread-safe, as is the next
  mutable TwoThreadRunner _runner;
};

}  // namespace salt
