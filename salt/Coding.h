#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Assert.h"
#include "salt/Index.h"

// Encoding of keys and values; FORMAT.md shows the bytes. Readers consume the front of a view.
// Input that is too short or invalid means a corrupt database and ends the process.
namespace salt {

// Upper bound in bytes of a varint of 32 and of 16 bits.
inline constexpr size_t kMaxVarint32 = 5;
inline constexpr size_t kMaxVarint16 = 3;

// Writes little-endian base 128 at `out` and returns the end.
inline char* putVarint(char* out, uint32_t value) {
  for (; value >= 0x80; value >>= 7) *out++ = static_cast<char>(value | 0x80);
  *out++ = static_cast<char>(value);
  return out;
}

inline void appendVarint(std::string* out, uint32_t value) {
  char bytes[kMaxVarint32];
  out->append(bytes, static_cast<size_t>(putVarint(bytes, value) - bytes));
}

inline uint32_t readVarint(std::string_view& s) {
  uint32_t value = 0;
  for (int shift = 0;; shift += 7) {
    TL_ASSERT(s.size());
    TL_ASSERT(shift < 32);
    const auto byte = static_cast<uint8_t>(s.front());
    s.remove_prefix(1);
    value |= static_cast<uint32_t>(byte & 0x7F) << shift;
    if (byte < 0x80) return value;
  }
}

// The byte at a position, or 0 after the end, as stored in `extra`.
inline uint8_t byteAt(std::string_view text, size_t at) {
  return at < text.size() ? static_cast<uint8_t>(text[at]) : 0;
}

// The length of the suffix text at the front of `text`: up to the first NUL, up to and including
// the first space at or after MinMatchLen, and at most MaxMatchLen.
[[nodiscard]] size_t suffixLength(std::string_view text, const Index::OptionsBlock& op);

// Sets `key` to shard number and text and, unless meta.DocID is 0, NUL and the varints of ZoneID,
// Offset and DocID. `text` must be truncated already.
void suffixKey(uint8_t shard, std::string_view text, const SuffixMeta& meta, std::string* key);

// Encodes a page of `count` suffixes in columns; replaces `value`.
void pageToValue(const SuffixMeta* metas, size_t count, std::string* value);
void valueToPage(std::string_view value, const Index::OptionsBlock& op,
                 std::vector<SuffixMeta>* metas);

// Decodes the places of a page; the remaining columns are not read.
void readPlaces(std::string_view value, const Index::OptionsBlock& op, std::vector<Place>* places);

// Key of a zone's text: 0xFF, decimal DocID, ",", decimal ZoneID.
class TextKey {
 public:
  TextKey(uint8_t shard, uint32_t docID, uint16_t zoneID);
  [[nodiscard]] std::string_view view() const { return {_bytes, _size}; }

 private:
  char _bytes[1 + 10 + 1 + 5];
  size_t _size;
};

// False when `key` is not the key of a zone's text.
[[nodiscard]] bool parseTextKey(std::string_view key, uint32_t* docID, uint16_t* zoneID);

}  // namespace salt
