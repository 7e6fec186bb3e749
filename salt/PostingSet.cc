#include "salt/PostingSet.h"

#include <algorithm>
#include <bit>

#include "salt/Coding.h"
#include "salt/ZoneMask.h"

namespace salt {

namespace {

// Delivers documents in batches.
class Runs {
 public:
  Runs(const std::vector<uint16_t>& zones, const PlacesCallback& callback)
      : _zones(zones), _callback(callback) {
    _run.reserve(kLength);
  }

  void add(const DocZones& doc) {
    _run.push_back(doc);
    if (_run.size() == kLength) flush();
  }

  void flush() {
    if (!_run.empty()) _callback(_zones, _run.data(), _run.size());
    _run.clear();
  }

 private:
  static constexpr size_t kLength = 512;

  const std::vector<uint16_t>& _zones;
  const PlacesCallback& _callback;
  std::vector<DocZones> _run;
};

}  // namespace

uint32_t ZoneBitTable::bitOf(uint16_t zoneID) {
  platform::MutexLock lock(_mutex);
  const auto known = std::find(_zones.begin(), _zones.end(), zoneID);
  const auto at = static_cast<size_t>(known - _zones.begin());
  if (at == kMaxZones) return 0;
  if (known == _zones.end()) _zones.push_back(zoneID);
  return uint32_t{1} << at;
}

std::vector<uint16_t> ZoneBitTable::zones() const {
  platform::MutexLock lock(_mutex);
  return _zones;
}

uint32_t PostingSet::newBit(uint16_t zoneID) {
  const uint32_t bit = _table->bitOf(zoneID);
  if (bit == 0) return 0;
  if (zoneID >= _bits.size()) _bits.resize(zoneID + size_t{1});
  return _bits[zoneID] = bit;
}

void PostingSet::add(PostingSet&& other) {
  _suffixes += other._suffixes;
  _masks.unite(std::move(other._masks));
  _others.insert(_others.end(), other._others.begin(), other._others.end());
}

PostingSet::Adder::Adder(PostingSet* set, const std::vector<uint16_t>& zones,
                         const std::vector<uint32_t>& masks)
    : _set(*set), _zones(zones), _masks(masks) {
  bool all = true;
  for (const uint16_t zone : zones) all = set->bitOf(zone) != 0 && all;
  if (!all) return;
  ZoneMaskMap bits(zones, [set](uint16_t zone) { return set->bitOf(zone); });
  for (const uint32_t mask : masks) _translated.push_back(bits.of(mask));
}

void PostingSet::Adder::addOneByOne(uint32_t docID, uint32_t mask) {
  for (; mask != 0; mask &= mask - 1) {
    const uint16_t zone = _zones[static_cast<size_t>(std::countr_zero(mask))];
    if (const uint32_t bit = _set.bitOf(zone); bit != 0) {
      _set._masks[docID] |= bit;
    } else {
      _set._others.push_back({docID, zone});
    }
  }
}

// For each document the delta of its DocID and its mask.
std::string PostingSet::encode() const {
  std::string out;
  uint32_t before = 0;
  forEach([&](uint32_t docID, uint32_t mask) {
    appendVarint(&out, docID - before);
    appendVarint(&out, mask);
    before = docID;
  });
  return out;
}

void PostingSet::addEncoded(std::string_view encoded) {
  uint32_t docID = 0;
  while (!encoded.empty()) {
    docID += readVarint(encoded);
    _masks[docID] |= readVarint(encoded);
  }
}

void FoundPlaces::deliver(const PlacesCallback& callback) const {
  for (const auto& set : {_hot, _pages}) {
    for (const Place& place : set->others()) {
      const DocZones doc{place.DocID, 1};
      callback({place.ZoneID}, &doc, 1);
    }
  }
  const std::vector<uint16_t> list = zones();
  Runs runs(list, callback);
  forEach([&](uint32_t docID, uint32_t mask) { runs.add({docID, mask}); });
  runs.flush();
}

}  // namespace salt
