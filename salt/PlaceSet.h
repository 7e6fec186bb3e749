#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "salt/DocPages.h"
#include "salt/Index.h"
#include "salt/ZoneMask.h"

namespace salt {

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

  // Adds documents with zones of one list. How many suffixes that are is told by itself.
  class Adder {
   public:
    Adder(PlaceSet* set, const std::vector<uint16_t>& zones);

    void add(const DocZones& doc) {
      if (_bits) {
        _set._masks[doc.DocID] |= _bits->of(doc.zones);
      } else {
        addOneByOne(doc);
      }
    }

   private:
    void addOneByOne(const DocZones& doc);

    PlaceSet& _set;
    const std::vector<uint16_t>& _zones;
    std::optional<ZoneMaskMap> _bits;  // none where the set has no bit for one of them
  };
  void addSuffixes(uint64_t count) { _suffixes += count; }

  [[nodiscard]] uint64_t suffixes() const { return _suffixes; }

  // The places in few bytes, documents in order; nothing when there are more zones than bits.
  [[nodiscard]] std::string encode() const;

  // Hands all places over, those of zones without a bit as often as they were added.
  void deliver(const PlacesCallback& callback) const;

  // The same for the places of an encoded set.
  static void deliver(std::string_view encoded, const PlacesCallback& callback);

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
