#include "salt/ScanCache.h"

namespace salt {

namespace {

// A set is kept as it is up to this size, and else as about three bytes a document.
constexpr size_t kMaxBytesPerSuffix = 16;

}  // namespace

ScanCache::Found::Found(std::shared_ptr<const PostingSet> set)
    : _table(set->table()), _suffixes(set->suffixes()) {
  if (set->bytes() <= kMaxBytesPerSuffix * _suffixes) {
    _set = std::move(set);
  } else {
    _encoded = set->encode();
  }
}

std::shared_ptr<const PostingSet> ScanCache::Found::set() const {
  if (_set) return _set;
  const auto decoded = std::make_shared<PostingSet>(_table);
  decoded->addEncoded(_encoded);
  decoded->addSuffixes(_suffixes);
  return decoded;
}

bool ScanCache::enter(uint64_t generation) {
  if (generation > _generation) {
    _byPrefix.clear();
    _entries.clear();
    _bytes = 0;
    _generation = generation;
  }
  return generation == _generation;
}

std::shared_ptr<const ScanCache::Found> ScanCache::find(std::string_view prefix,
                                                        uint64_t generation) {
  platform::MutexLock lock(_mutex);
  if (!enter(generation)) return nullptr;
  const auto known = _byPrefix.find(prefix);
  if (known == _byPrefix.end()) return nullptr;
  _entries.splice(_entries.begin(), _entries, known->second);
  return _entries.front().found;
}

void ScanCache::keep(std::string_view prefix, uint64_t generation,
                     std::shared_ptr<const Found> found) {
  platform::MutexLock lock(_mutex);
  if (!enter(generation) || _byPrefix.contains(prefix)) return;
  _entries.push_front({std::string(prefix), std::move(found)});
  _byPrefix.emplace(_entries.front().prefix, _entries.begin());
  _bytes += _entries.front().bytes();
  while (_bytes > kMaxBytes) {
    _bytes -= _entries.back().bytes();
    _byPrefix.erase(_entries.back().prefix);
    _entries.pop_back();
  }
}

}  // namespace salt
