#pragma once

#include <bit>
#include <cstdint>
#include <vector>

namespace salt {

// Translates zone masks over one list into other masks. Neighbouring documents mostly match in the
// same zones, so the last result is cached. One thread.
class ZoneMaskMap {
 public:
  // bitOf(zone) is the mask that stands for a zone: one bit, several or none.
  template <typename BitOf>
  ZoneMaskMap(const std::vector<uint16_t>& zones, const BitOf& bitOf) {
    for (const uint16_t zone : zones) _bits.push_back(bitOf(zone));
  }

  [[nodiscard]] uint32_t of(uint32_t mask) {
    if (mask == _latest) return _result;
    _latest = mask;
    _result = 0;
    for (; mask != 0; mask &= mask - 1)
      _result |= _bits[static_cast<size_t>(std::countr_zero(mask))];
    return _result;
  }

 private:
  std::vector<uint32_t> _bits;
  uint32_t _latest = 0;
  uint32_t _result = 0;
};

}  // namespace salt
