#include "salt/PlaceSet.h"

#include <bit>

#include "salt/Coding.h"

namespace salt {

namespace {

// Gathers places into runs.
class Runs {
 public:
  explicit Runs(const PlaceCallback& callback) : _callback(callback) { _run.reserve(kLength); }

  void add(uint32_t docID, uint32_t mask, const std::vector<uint16_t>& zones) {
    for (; mask != 0; mask &= mask - 1) {
      _run.push_back({docID, zones[static_cast<size_t>(std::countr_zero(mask))]});
      if (_run.size() == kLength) flush();
    }
  }

  void flush() {
    if (!_run.empty()) _callback(_run.data(), _run.size());
    _run.clear();
  }

 private:
  static constexpr size_t kLength = 512;

  const PlaceCallback& _callback;
  std::vector<Place> _run;
};

void appendVarint(std::string* out, uint32_t value) {
  char bytes[kMaxVarint32];
  out->append(bytes, static_cast<size_t>(putVarint(bytes, value) - bytes));
}

}  // namespace

uint32_t PlaceSet::newBit(uint16_t zoneID) {
  if (_zones.size() == kMaxZones) return 0;
  if (zoneID >= _bits.size()) _bits.resize(zoneID + size_t{1});
  _bits[zoneID] = uint32_t{1} << _zones.size();
  _zones.push_back(zoneID);
  return _bits[zoneID];
}

void PlaceSet::add(PlaceSet&& other) {
  if (_suffixes == 0) std::swap(*this, other);
  if (other._suffixes == 0) return;
  const uint64_t suffixes = _suffixes + other._suffixes;
  other.deliver([this](const Place* places, size_t count) {
    for (const Place* place = places; place != places + count; ++place) add(*place);
  });
  _suffixes = suffixes;
}

void PlaceSet::add(uint32_t docID, uint32_t mask, const std::vector<uint16_t>& zones) {
  for (; mask != 0; mask &= mask - 1) {
    const uint16_t zone = zones[static_cast<size_t>(std::countr_zero(mask))];
    if (const uint32_t bit = bitOf(zone); bit != 0) {
      _masks[docID] |= bit;
    } else {
      _others.push_back({docID, zone});
    }
  }
}

// Number of zones, the zones, then for each document its distance from the one before and its mask.
std::string PlaceSet::encode() const {
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

void PlaceSet::deliver(const PlaceCallback& callback) const {
  if (!_others.empty()) callback(_others.data(), _others.size());
  Runs runs(callback);
  _masks.forEach([&](uint32_t docID, uint32_t mask) { runs.add(docID, mask, _zones); });
  runs.flush();
}

void PlaceSet::deliver(std::string_view encoded, const PlaceCallback& callback) {
  std::vector<uint16_t> zones(readVarint(encoded));
  for (uint16_t& zone : zones) zone = static_cast<uint16_t>(readVarint(encoded));
  Runs runs(callback);
  uint32_t docID = 0;
  while (!encoded.empty()) {
    docID += readVarint(encoded);
    runs.add(docID, readVarint(encoded), zones);
  }
  runs.flush();
}

}  // namespace salt
