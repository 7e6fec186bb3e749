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

// A Bloom filter with one hash function over the first bytes of all suffixes: for most prefixes
// that no suffix begins with, it says so without a look at the index. Bits are never cleared:
// merges change no suffix, and a deleted suffix costs only an unnecessary look.
//
// It is built when the first query asks: by a scan over the stored texts on a thread of its own,
// while suffixes added to the index are entered as they come. Until the scan ends, every prefix may
// be present. The scan enters every position of a text, because only the pages know which positions
// begin a suffix. With a hundred thousand mails about ten percent of the bits are set.
//
// Any thread. `add` must be called before the suffix becomes readable.
class SuffixStarts {
 public:
  // Calls its argument for each stored text until that returns false; returns true when all were
  // read.
  using ForEachText = std::function<bool(const std::function<bool(std::string_view text)>&)>;

  SuffixStarts() : _bits(static_cast<uint64_t*>(std::calloc(kBits / 64, sizeof(uint64_t)))) {
    if (_bits == nullptr) throw std::bad_alloc();
  }
  // Stops the scan if it is running.
  ~SuffixStarts();
  SuffixStarts(const SuffixStarts&) = delete;
  SuffixStarts& operator=(const SuffixStarts&) = delete;

  // Starts the scan unless it has started; a later call tries again if the system could not create
  // a thread. `forEachText` must begin with a wait for the additions in hand, which may have found
  // the scan not begun.
  void beginWith(ForEachText forEachText) TL_EXCLUDES(_mutex);
  [[nodiscard]] bool complete() const { return _complete; }

  // A suffix begins with `text`; it may end sooner.
  void add(std::string_view text) {
    if (!_begun || text.size() < kBytes) return;
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
  static constexpr size_t kBytes = 5;  // of a suffix; fewer are too unspecific, more fill the table
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
  // The kernel allocates its pages at the first bit, so an unused index costs no memory.
  const std::unique_ptr<uint64_t, Free> _bits;
  std::atomic<bool> _begun{false};
  std::atomic<bool> _complete{false};
  std::atomic<bool> _ending{false};
  platform::Mutex _mutex;
  std::thread _thread TL_GUARDED_BY(_mutex);  // runs the scan
};

}  // namespace salt
