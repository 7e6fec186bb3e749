#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string>
#include <string_view>

// Bit strings of gamma codes (Elias, 1975): a number of n bits is n - 1 zeros and then its bits,
// the highest first. 1 takes one bit, 2 and 3 take three, 4 to 7 five.
namespace salt {

// The largest number that has a code here.
inline constexpr uint32_t kMaxGamma = (uint32_t{1} << 28) - 1;

// The bits of the code of a number.
[[nodiscard]] constexpr unsigned gammaBits(uint32_t value) {
  return 2 * static_cast<unsigned>(std::bit_width(value)) - 1;
}

// Appends codes to a string. One thread.
class BitWriter {
 public:
  explicit BitWriter(std::string* out) : _out(*out) {}

  // `value` is from 1 to kMaxGamma.
  void putGamma(uint32_t value) { put(value, gammaBits(value)); }

  // Fills the last byte with zeros; nothing can be put afterwards.
  void finish() {
    if (_used != 0) _out += static_cast<char>(_bits << (8 - _used));
    _used = 0;
  }

 private:
  void put(uint64_t value, unsigned count) {
    _bits = _bits << count | value;
    for (_used += count; _used >= 8;) {
      _used -= 8;
      _out += static_cast<char>(_bits >> _used);
    }
  }

  std::string& _out;
  uint64_t _bits = 0;  // the last `_used` of them are not in the string yet
  unsigned _used = 0;  // less than 8 between calls
};

// Reads codes from untrusted bytes. One thread; the bytes outlive it.
class BitReader {
 public:
  explicit BitReader(std::string_view bytes) : _bytes(bytes) {}

  // The next number. At the end or at invalid bits it clears `good` and returns 0.
  uint32_t gamma() {
    if (codeLength() > _count && _count <= 56) fill();
    const unsigned length = codeLength();
    if (length > _count || length > kMaxLength) {
      good = false;
      return 0;
    }
    const auto value = static_cast<uint32_t>(_bits >> (64 - length));
    _bits <<= length;
    _count -= length;
    return value;
  }

  bool good = true;

 private:
  static constexpr unsigned kMaxLength = 2 * std::bit_width(kMaxGamma) - 1;

  [[nodiscard]] unsigned codeLength() const {
    return 2 * static_cast<unsigned>(std::countl_zero(_bits)) + 1;
  }

  // Has at least 57 bits in hand afterwards, unless the bytes end.
  void fill() {
    if (uint64_t next = 0; _bytes.size() - _at >= sizeof next) {
      std::memcpy(&next, _bytes.data() + _at, sizeof next);
      if constexpr (std::endian::native == std::endian::little) next = __builtin_bswap64(next);
      const unsigned taken = (64 - _count) / 8;
      _bits |= next >> _count;
      _at += taken;
      _count += 8 * taken;
      // Bits that belong to the byte which is read next time.
      if (_count < 64) _bits &= ~(UINT64_MAX >> _count);
      return;
    }
    for (; _at < _bytes.size() && _count <= 56; ++_at, _count += 8) {
      _bits |= static_cast<uint64_t>(static_cast<uint8_t>(_bytes[_at])) << (56 - _count);
    }
  }

  std::string_view _bytes;
  size_t _at = 0;       // of the next byte to fill in
  uint64_t _bits = 0;   // the next bits, from the highest on, zeros after them
  unsigned _count = 0;  // of them
};

}  // namespace salt
