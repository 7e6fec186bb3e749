#include "salt/Coding.h"

#include <algorithm>
#include <charconv>
#include <cstring>

namespace salt {

namespace {

constexpr uint8_t kNamedShard = 0xFF;

// Varints of ZoneID, Offset and DocID.
constexpr size_t kMaxTail = kMaxVarint16 + 2 * kMaxVarint32;

char* putTail(char* out, const SuffixMeta& meta) {
  return putVarint(putVarint(putVarint(out, meta.ZoneID), meta.Offset), meta.DocID);
}

size_t readPageSize(std::string_view& s, const Index::OptionsBlock& op) {
  const size_t size = readVarint(s);
  TL_ASSERT(size <= op.MaxPageSuffixes);
  return size;
}

// readVarint without the bounds check: the caller knows that the longest varint fits.
const char* getVarint(const char* in, uint32_t* value) {
  uint32_t byte = static_cast<uint8_t>(*in++);
  *value = byte & 0x7F;
  for (int shift = 7; byte >= 0x80; shift += 7) {
    TL_ASSERT(shift < 32);
    byte = static_cast<uint8_t>(*in++);
    *value |= (byte & 0x7F) << shift;
  }
  return in;
}

// Reads `count` varints from the front and passes each to store(index, value). Checks the bounds
// once for all of them where possible.
template <typename Store>
void readColumn(std::string_view& s, size_t count, const Store& store) {
  if (s.size() < count * kMaxVarint32) {
    for (size_t i = 0; i < count; ++i) store(i, readVarint(s));
    return;
  }
  const char* in = s.data();
  for (size_t i = 0; i < count; ++i) {
    uint32_t value = 0;
    in = getVarint(in, &value);
    store(i, value);
  }
  s.remove_prefix(static_cast<size_t>(in - s.data()));
}

// The position of `byte` in [from, limit) of `text`, or `limit`.
size_t findByte(std::string_view text, char byte, size_t from, size_t limit) {
  const void* found = std::memchr(text.data() + from, byte, limit - from);
  if (found == nullptr) return limit;
  return static_cast<size_t>(static_cast<const char*>(found) - text.data());
}

}  // namespace

size_t suffixLength(std::string_view text, const Index::OptionsBlock& op) {
  size_t limit = std::min<size_t>(text.size(), op.MaxMatchLen);
  if (limit > op.MinMatchLen) {
    limit = std::min(limit, findByte(text, ' ', op.MinMatchLen, limit) + 1);
  }
  return limit == 0 ? 0 : findByte(text, '\0', 0, limit);
}

void suffixKey(uint8_t shard, std::string_view text, const SuffixMeta& meta, std::string* key) {
  key->clear();
  key->push_back(static_cast<char>(shard));
  key->append(text);
  if (meta.DocID == 0) return;
  char tail[1 + kMaxTail];
  tail[0] = '\0';
  key->append(tail, static_cast<size_t>(putTail(tail + 1, meta) - tail));
}

bool SuffixMeta::operator<(const SuffixMeta& other) const {
  char mine[kMaxTail];
  char theirs[kMaxTail];
  const std::string_view left(mine, static_cast<size_t>(putTail(mine, *this) - mine));
  const std::string_view right(theirs, static_cast<size_t>(putTail(theirs, other) - theirs));
  return left < right;
}

void pageToValue(const SuffixMeta* metas, size_t count, std::string* value) {
  value->resize(kMaxVarint32 + count * (3 * kMaxVarint32 + kMaxVarint16 + 2));
  char* out = putVarint(value->data(), static_cast<uint32_t>(count));
  const SuffixMeta* const end = metas + count;
  for (const SuffixMeta* m = metas; m != end; ++m) out = putVarint(out, m->DocID);
  for (const SuffixMeta* m = metas; m != end; ++m) out = putVarint(out, m->ZoneID);
  for (const SuffixMeta* m = metas; m != end; ++m) out = putVarint(out, m->Offset);
  for (const SuffixMeta* m = metas; m != end; ++m) out = putVarint(out, m->lcp);
  for (const SuffixMeta* m = metas; m != end; ++m) {
    *out++ = static_cast<char>(m->extra[0]);
    *out++ = static_cast<char>(m->extra[1]);
  }
  value->resize(static_cast<size_t>(out - value->data()));
}

void valueToPage(std::string_view s, const Index::OptionsBlock& op,
                 std::vector<SuffixMeta>* metas) {
  const size_t size = readPageSize(s, op);
  metas->resize(size);
  SuffixMeta* const m = metas->data();
  readColumn(s, size, [m](size_t i, uint32_t value) { m[i].DocID = value; });
  readColumn(s, size, [m](size_t i, uint32_t value) { m[i].ZoneID = uint16_t(value); });
  readColumn(s, size, [m](size_t i, uint32_t value) { m[i].Offset = value; });
  readColumn(s, size, [m](size_t i, uint32_t value) { m[i].lcp = uint8_t(value); });
  TL_ASSERT(s.size() >= 2 * size);
  for (size_t i = 0; i < size; ++i) {
    m[i].extra[0] = static_cast<uint8_t>(s[2 * i]);
    m[i].extra[1] = static_cast<uint8_t>(s[2 * i + 1]);
  }
}

void readPlaces(std::string_view s, const Index::OptionsBlock& op, std::vector<Place>* places) {
  const size_t size = readPageSize(s, op);
  places->resize(size);
  Place* const p = places->data();
  readColumn(s, size, [p](size_t i, uint32_t value) { p[i].DocID = value; });
  readColumn(s, size, [p](size_t i, uint32_t value) { p[i].ZoneID = uint16_t(value); });
}

TextKey::TextKey(uint8_t shard, uint32_t docID, uint16_t zoneID) {
  char* const end = _bytes + sizeof _bytes;
  _bytes[0] = static_cast<char>(shard);
  char* out = std::to_chars(_bytes + 1, end, docID).ptr;
  *out++ = ',';
  out = std::to_chars(out, end, zoneID).ptr;
  _size = static_cast<size_t>(out - _bytes);
}

bool parseTextKey(std::string_view key, uint32_t* docID, uint16_t* zoneID) {
  if (key.empty() || static_cast<uint8_t>(key.front()) != kNamedShard) return false;
  const char* const end = key.data() + key.size();
  const auto doc = std::from_chars(key.data() + 1, end, *docID);
  if (doc.ec != std::errc() || doc.ptr == end || *doc.ptr != ',') return false;
  const auto zone = std::from_chars(doc.ptr + 1, end, *zoneID);
  return zone.ec == std::errc() && zone.ptr == end;
}

}  // namespace salt
