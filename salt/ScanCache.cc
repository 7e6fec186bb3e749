#include "salt/ScanCache.h"

namespace salt {

bool ScanCache::enter(uint64_t generation) {
  if (generation > _generation) {
    _byPrefix.clear();
    _entries.clear();
    _bytes = 0;
    _generation = generation;
  }
  return generation == _generation;
}

std::shared_ptr<const PostingSet> ScanCache::find(std::string_view prefix, uint64_t generation) {
  platform::MutexLock lock(_mutex);
  if (!enter(generation)) return nullptr;
  const auto known = _byPrefix.find(prefix);
  if (known == _byPrefix.end()) return nullptr;
  _entries.splice(_entries.begin(), _entries, known->second);
  return _entries.front().found;
}

void ScanCache::keep(std::string_view prefix, uint64_t generation,
                     std::shared_ptr<const PostingSet> found) {
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
