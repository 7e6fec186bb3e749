#pragma once

#include <atomic>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <memory>
#include <new>
#include <string_view>
#include <thread>

#include "platform/Mutex.h"

namespace salt {

// With which bytes suffixes begin, as bits in a table of hashes (a Bloom filter with one function):
// tells of most prefixes that nothing begins with them, without a look at the index. Bits are never
// taken back, for merges change no suffix, and a deleted one costs a look in vain.
//
// What is added to the index is entered as it comes; what was there before, once somebody asks, by
// a walk over the stored texts on a thread of its own. Until that has ended, everything may be
// there. It enters all places of a text, since which of them begin suffixes only the pages know.
// Among a hundred thousand mails some ten percent of the bits are set.
//
// Any thread. Whoever adds calls `add` before the suffix can be read.
class SuffixStarts {
 public:
  // Calls its argument for each stored text until that returns false; true when all were read.
  using Walk = std::function<bool(const std::function<bool(std::string_view text)>&)>;

  SuffixStarts() : _bits(static_cast<uint64_t*>(std::calloc(kBits / 64, sizeof(uint64_t)))) {
    if (_bits == nullptr) throw std::bad_alloc();
  }
  // Ends a walk that runs.
  ~SuffixStarts();
  SuffixStarts(const SuffixStarts&) = delete;
  SuffixStarts& operator=(const SuffixStarts&) = delete;

  // There was nothing before.
  void beginEmpty() { _complete = true; }
  // Starts the walk, once; later where the system has no thread to give now.
  void beginWith(Walk walk) TL_EXCLUDES(_mutex);
  [[nodiscard]] bool complete() const { return _complete; }

  // A suffix begins where `text` does; it may end sooner.
  void add(std::string_view text) {
    if (text.size() < kBytes) return;
    const uint64_t hash = hashOf(text.data());
    const std::atomic_ref<uint64_t> bits(_bits.get()[hash / 64]);
    const uint64_t bit = uint64_t{1} << hash % 64;
    if ((bits.load(std::memory_order_relaxed) & bit) == 0) {
      bits.fetch_or(bit, std::memory_order_relaxed);
    }
  }

  // False when no suffix begins with the prefix.
  [[nodiscard]] bool mayBegin(std::string_view prefix) const {
    if (prefix.size() < kBytes || !_complete) return true;
    const uint64_t hash = hashOf(prefix.data());
    const std::atomic_ref<uint64_t> bits(_bits.get()[hash / 64]);
    return (bits.load(std::memory_order_relaxed) >> hash % 64 & 1) != 0;
  }

 private:
  static constexpr size_t kBytes = 5;  // of a suffix; fewer tell too little, more fill the table
  static constexpr unsigned kLogBits = 24;
  static constexpr size_t kBits = size_t{1} << kLogBits;  // 2 MiB

  static uint64_t hashOf(const char* bytes) {
    uint64_t value = 0;
    std::memcpy(&value, bytes, kBytes);
    return value * UINT64_C(0x9E3779B97F4A7C15) >> (64 - kLogBits);
  }

  struct Free {
    void operator()(uint64_t* bits) const { std::free(bits); }
  };
  // Pages of it come into being with their first bit: of an index that nobody uses there are none.
  const std::unique_ptr<uint64_t, Free> _bits;
  std::atomic<bool> _complete{false};
  std::atomic<bool> _ending{false};
  platform::Mutex _mutex;
  std::thread _thread TL_GUARDED_BY(_mutex);  // of the walk
};

}  // namespace salt
