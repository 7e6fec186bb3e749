#include "salt/PostingSet.h"

#include <bit>

#include "salt/Coding.h"

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

void appendVarint(std::string* out, uint32_t value) {
  char bytes[kMaxVarint32];
  out->append(bytes, static_cast<size_t>(putVarint(bytes, value) - bytes));
}

}  // namespace

uint32_t PostingSet::newBit(uint16_t zoneID) {
  if (_zones.size() == kMaxZones) return 0;
  if (zoneID >= _bits.size()) _bits.resize(zoneID + size_t{1});
  _bits[zoneID] = uint32_t{1} << _zones.size();
  _zones.push_back(zoneID);
  return _bits[zoneID];
}

void PostingSet::add(PostingSet&& other) {
  if (_suffixes == 0) std::swap(*this, other);
  if (other._suffixes == 0) return;
  other.deliver([this](const std::vector<uint16_t>& zones, const DocZones* docs, size_t count) {
    Adder adder(this, zones);
    for (const DocZones* doc = docs; doc != docs + count; ++doc) adder.add(*doc);
  });
  addSuffixes(other._suffixes);
}

PostingSet::Adder::Adder(PostingSet* set, const std::vector<uint16_t>& zones)
    : _set(*set), _zones(zones) {
  bool all = true;
  for (const uint16_t zone : zones) all = set->bitOf(zone) != 0 && all;
  if (all) _bits.emplace(zones, [set](uint16_t zone) { return set->bitOf(zone); });
}

void PostingSet::Adder::addOneByOne(const DocZones& doc) {
  for (uint32_t mask = doc.zones; mask != 0; mask &= mask - 1) {
    const uint16_t zone = _zones[static_cast<size_t>(std::countr_zero(mask))];
    if (const uint32_t bit = _set.bitOf(zone); bit != 0) {
      _set._masks[doc.DocID] |= bit;
    } else {
      _set._others.push_back({doc.DocID, zone});
    }
  }
}

// Number of zones, the zones, then for each document the delta of its DocID and its mask.
std::string PostingSet::encode() const {
  std::string out;
  if (!_others.empty()) return out;
  appendVarint(&out, static_cast<uint32_t>(_zones.size()));
  for (const uint16_t zone : _zones) appendVarint(&out, zone);
  uint32_t before = 0;
  _masks.forEach([&](uint32_t docID, uint32_t mask) {
    if (mask == 0) return;
    appendVarint(&out, docID - before);
    appendVarint(&out, mask);
    before = docID;
  });
  return out;
}

void PostingSet::deliver(const PlacesCallback& callback) const {
  for (const Place& place : _others) {
    const DocZones doc{place.DocID, 1};
    callback({place.ZoneID}, &doc, 1);
  }
  Runs runs(_zones, callback);
  _masks.forEach([&](uint32_t docID, uint32_t mask) {
    if (mask != 0) runs.add({docID, mask});
  });
  runs.flush();
}

void PostingSet::deliver(std::string_view encoded, const PlacesCallback& callback) {
  std::vector<uint16_t> zones(readVarint(encoded));
  for (uint16_t& zone : zones) zone = static_cast<uint16_t>(readVarint(encoded));
  Runs runs(zones, callback);
  uint32_t docID = 0;
  while (!encoded.empty()) {
    docID += readVarint(encoded);
    runs.add({docID, readVarint(encoded)});
  }
  runs.flush();
}

}  // namespace salt
