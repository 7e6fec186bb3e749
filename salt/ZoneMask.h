#pragma once

#include <array>
#include <bit>
#include <cstddef>
#include <cstdint>
#include <vector>

namespace salt {

// Remembers what was computed for zone masks: most of the documents of a search match in one of a
// few sets of zones. One thread.
template <typename Value>
class MaskMemo {
 public:
  // What compute(mask) returns, now or earlier; it must depend on nothing else.
  template <typename Compute>
  Value of(uint32_t mask, const Compute& compute) {
    Entry& entry = _entries[mask * kFactor >> kShift];
    if (!entry.known || entry.mask != mask) entry = {mask, true, compute(mask)};
    return entry.value;
  }

 private:
  static constexpr uint32_t kFactor = 0x9E3779B1;
  static constexpr unsigned kShift = 32 - 5;

  struct Entry {
    uint32_t mask = 0;
    bool known = false;
    Value value{};
  };

  std::array<Entry, size_t{1} << (32 - kShift)> _entries;
};

// Translates zone masks over one list into other masks. One thread.
class ZoneMaskMap {
 public:
  // bitOf(zone) is the mask that stands for a zone: one bit, several or none.
  template <typename BitOf>
  ZoneMaskMap(const std::vector<uint16_t>& zones, const BitOf& bitOf) {
    for (const uint16_t zone : zones) {
      _bits.push_back(bitOf(zone));
      if (_bits.back() != 0) _effective |= uint32_t{1} << (_bits.size() - 1);
    }
  }

  // The bits that have a result other than 0.
  [[nodiscard]] uint32_t effective() const { return _effective; }

  [[nodiscard]] uint32_t of(uint32_t mask) {
    return _memo.of(mask, [this](uint32_t bits) { return translate(bits); });
  }

 private:
  [[nodiscard]] uint32_t translate(uint32_t mask) const {
    uint32_t result = 0;
    for (; mask != 0; mask &= mask - 1) {
      result |= _bits[static_cast<size_t>(std::countr_zero(mask))];
    }
    return result;
  }

  std::vector<uint32_t> _bits;
  uint32_t _effective = 0;
  MaskMemo<uint32_t> _memo;
};

}  // namespace salt
