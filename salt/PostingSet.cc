#include "salt/PostingSet.h"

#include <algorithm>

namespace salt {

void PostingSet::add(PostingSet&& other) {
  if (_zones.empty()) {
    const uint64_t before = _suffixes;
    *this = std::move(other);
    _suffixes += before;
    return;
  }
  _suffixes += other._suffixes;
  insert(other);
}

void PostingSet::insert(const PostingSet& other) {
  for (const Zone& zone : other._zones) docsOf(zone.ZoneID).insert(zone.docs);
}

void PostingSet::erase(const DocSet& docs) {
  for (Zone& zone : _zones) zone.docs.erase(docs);
}

bool PostingSet::empty() const {
  return std::all_of(_zones.begin(), _zones.end(),
                     [](const Zone& zone) { return zone.docs.empty(); });
}

size_t PostingSet::bytes() const {
  size_t sum = sizeof *this + _places.capacity() * sizeof(_places[0]);
  for (const Zone& zone : _zones) sum += sizeof zone + zone.docs.bytes();
  return sum;
}

DocSet& PostingSet::newZone(uint16_t zoneID) {
  if (zoneID >= _places.size()) _places.resize(zoneID + size_t{1});
  _zones.push_back({zoneID, {}});
  _places[zoneID] = static_cast<uint32_t>(_zones.size());
  return _zones.back().docs;
}

}  // namespace salt
