#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <string_view>
#include <vector>

#include "salt/DocPages.h"
#include "salt/Index.h"

namespace salt {

// Takes what a scan delivers, a run at a time; the places live for the call.
using PlaceCallback = std::function<void(const Place* places, size_t count)>;

// The different places among those of many suffixes, and how many suffixes there were. A mail has
// some ten zones, so that a document's are the bits of a number. One thread.
class PlaceSet {
 public:
  void add(const Place& place) {
    ++_suffixes;
    const uint32_t bit = bitOf(place.ZoneID);
    if (bit == 0) {
      _others.push_back(place);
    } else {
      _masks[place.DocID] |= bit;
    }
  }

  // Both are of different suffixes.
  void add(PlaceSet&& other);

  // Places of a document, in the zones of the bits of `mask`; how many suffixes that are is told
  // by itself.
  void add(uint32_t docID, uint32_t mask, const std::vector<uint16_t>& zones);
  void addSuffixes(uint64_t count) { _suffixes += count; }

  [[nodiscard]] uint64_t suffixes() const { return _suffixes; }

  // The places in few bytes, documents in order; nothing when there are more zones than bits.
  [[nodiscard]] std::string encode() const;

  // Hands all places over, those of zones without a bit as often as they were added.
  void deliver(const PlaceCallback& callback) const;

  // The same for the places of an encoded set.
  static void deliver(std::string_view encoded, const PlaceCallback& callback);

 private:
  static constexpr size_t kMaxZones = 32;

  [[nodiscard]] uint32_t bitOf(uint16_t zoneID) {
    const uint32_t bit = zoneID < _bits.size() ? _bits[zoneID] : 0;
    return bit != 0 ? bit : newBit(zoneID);
  }
  // 0 when there is none left.
  uint32_t newBit(uint16_t zoneID);

  uint64_t _suffixes = 0;
  DocPages<uint32_t> _masks;
  std::vector<uint32_t> _bits;   // by zone
  std::vector<uint16_t> _zones;  // by bit
  std::vector<Place> _others;
};

}  // namespace salt
