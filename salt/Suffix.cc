#include "salt/Suffix.h"

#include <algorithm>
#include <cstring>

#include "salt/Coding.h"
#include "salt/IndexImpl.h"
#include "salt/ZoneTextCache.h"

namespace salt {

// Reads bypass the block cache: the few texts that a scan completes are scattered, and their blocks
// would evict those of the scan, which the next token, often a longer or shorter form of this one,
// needs again.
Suffix::Suffix(const index& owner, ZoneTextCache* zoneTexts)
    : idx(owner),
      options(readOptions(false)),
      _zoneTexts(zoneTexts),
      _text(std::make_unique<char[]>(owner.op.MaxMatchLen)) {}

Suffix& Suffix::operator=(const Suffix& suffix) {
  if (this == &suffix) return *this;
  TL_ASSERT(suffix.size <= idx.op.MaxMatchLen);
  std::memcpy(_text.get(), suffix._text.get(), suffix.size);
  size = suffix.size;
  full = suffix.full;
  meta = suffix.meta;
  return *this;
}

void Suffix::fromKey(std::string_view key) {
  TL_ASSERT(key.size());
  key.remove_prefix(1);
  size = std::min(key.find('\0'), key.size());
  TL_ASSERT(size <= idx.op.MaxMatchLen);
  std::memcpy(_text.get(), key.data(), size);
  full = true;
  key.remove_prefix(std::min(size + 1, key.size()));
  meta = {};
  meta.ZoneID = static_cast<uint16_t>(readVarint(key));
  meta.Offset = readVarint(key);
  meta.DocID = readVarint(key);
  TL_ASSERT(key.size() == 0);
}

void Suffix::fromNextMeta(const SuffixMeta& next) {
  meta = next;
  TL_ASSERT(!(full && meta.lcp > size));
  full = false;
  if (size < meta.lcp) return;
  const bool first = meta.extra[0] != 0;
  const bool second = first && meta.extra[1] != 0;
  size = size_t{meta.lcp} + first + second;
  TL_ASSERT(size <= idx.op.MaxMatchLen);
  if (first) _text[meta.lcp] = static_cast<char>(meta.extra[0]);
  if (second) _text[meta.lcp + size_t{1}] = static_cast<char>(meta.extra[1]);
  full = !second && size != 0;
}

void Suffix::fetch() {
  if (full) return;
  TL_ASSERT(meta.DocID > 0);
  ++fetches;
  bool readable = true;
  std::string_view text;
  if (_zoneTexts != nullptr) {
    text = _zoneTexts->find(meta);
    readable = _zoneTexts->good();
  } else {
    text = idx.fullText(meta, options, &_zoneText, &readable);
  }
  full = true;
  if (!readable) return;  // by a failure of the system: make do with the known part
  TL_ASSERT(text.size() >= size);
  std::memcpy(_text.get() + size, text.data() + size, text.size() - size);
  size = text.size();
}

int Suffix::compareWithPrefix(std::string_view prefix) {
  if (prefix.empty()) return 0;
  for (size_t done = 0;;) {
    const size_t known = std::min(size, prefix.size());
    const int order = std::memcmp(_text.get() + done, prefix.data() + done, known - done);
    if (order != 0 || known == prefix.size()) return order;
    if (full) return -1;
    done = known;
    fetch();
  }
}

size_t commonPrefix(Suffix* left, Suffix* right) {
  for (size_t lcp = 0;;) {
    const std::string_view l = left->knownText();
    const std::string_view r = right->knownText();
    const size_t limit = std::min(l.size(), r.size());
    while (lcp < limit && l[lcp] == r[lcp]) ++lcp;
    if (lcp == l.size() && !left->full) {
      left->fetch();
    } else if (lcp == r.size() && !right->full) {
      right->fetch();
    } else {
      return lcp;
    }
  }
}

void relate(Suffix* suffix, size_t lcp, SuffixMeta* meta) {
  if (suffix->size < lcp + 2) suffix->fetch();
  meta->lcp = static_cast<uint8_t>(lcp);
  meta->extra[0] = byteAt(suffix->knownText(), lcp);
  meta->extra[1] = byteAt(suffix->knownText(), lcp + 1);
}

ShardCursor::ShardCursor(const IndexView& view, uint8_t shardNumber, ZoneTextCache* zoneTexts,
                         size_t iteratorIndex)
    : idx(view.idx),
      shard(shardNumber),
      iterator(view.iterators[iteratorIndex].get()),
      suffix(idx, zoneTexts) {}

void ShardCursor::moveTo(uint8_t shardNumber) {
  shard = shardNumber;
  metas.clear();
  pos = 0;
  valid = false;
  loads = 0;
  suffix.fetches = 0;
}

bool ShardCursor::inShard() const {
  if (!iterator->Valid()) return false;
  const leveldb::Slice key = iterator->key();
  return !key.empty() && static_cast<uint8_t>(key[0]) == shard;
}

void ShardCursor::seekToFirst() {
  const char first = static_cast<char>(shard);
  iterator->Seek({&first, 1});
  load();
}

void ShardCursor::seek(std::string_view prefix) {
  suffixKey(shard, prefix, {}, &_key);
  iterator->Seek(_key);
  if (shard == 0) {
    load();
    return;
  }
  // The wanted suffix may be inside the page before the one found.
  if (iterator->Valid()) {
    iterator->Prev();
  } else {
    iterator->SeekToLast();
  }
  if (inShard()) {
    load();
  } else {
    seekToFirst();
  }
  while (valid && suffix.compareWithPrefix(prefix) < 0) next();
}

void ShardCursor::next() {
  TL_ASSERT(valid);
  ++pos;
  if (pos < metas.size()) {
    suffix.fromNextMeta(metas[pos]);
  } else {
    iterator->Next();
    load();
  }
}

void ShardCursor::load() {
  pos = 0;
  valid = inShard();
  if (!valid) return;
  ++loads;
  suffix.fromKey(view(iterator->key()));
  if (shard != 0) valueToPage(view(iterator->value()), idx.op, &metas);
}

}  // namespace salt
