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

// The distinct places of many suffixes, and the number of suffixes. A mail has about ten zones, so
// the zones of a document are stored as the bits of one number. One thread.
class PostingSet {
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

  // The two sets must not count the same suffix.
  void add(PostingSet&& other);

  // Adds documents whose zone bits index one list. Their suffixes are counted separately, by
  // addSuffixes.
  class Adder {
   public:
    Adder(PostingSet* set, const std::vector<uint16_t>& zones);

    void add(const DocZones& doc) {
      if (_bits) {
        _set._masks[doc.DocID] |= _bits->of(doc.zones);
      } else {
        addOneByOne(doc);
      }
    }

   private:
    void addOneByOne(const DocZones& doc);

    PostingSet& _set;
    const std::vector<uint16_t>& _zones;
    std::optional<ZoneMaskMap> _bits;  // nullopt when the set has no bit left for one of them
  };
  void addSuffixes(uint64_t count) { _suffixes += count; }

  [[nodiscard]] uint64_t suffixes() const { return _suffixes; }

  // The places in compact form, documents in ascending order; empty when there are more zones than
  // bits.
  [[nodiscard]] std::string encode() const;

  // Delivers all places; those in zones without a bit as often as they were added.
  void deliver(const PlacesCallback& callback) const;

  // Delivers the places of an encoded set.
  static void deliver(std::string_view encoded, const PlacesCallback& callback);

 private:
  static constexpr size_t kMaxZones = 32;

  [[nodiscard]] uint32_t bitOf(uint16_t zoneID) {
    const uint32_t bit = zoneID < _bits.size() ? _bits[zoneID] : 0;
    return bit != 0 ? bit : newBit(zoneID);
  }
  // Assigns a bit to the zone; 0 when none is left.
  uint32_t newBit(uint16_t zoneID);

  uint64_t _suffixes = 0;
  DocPages<uint32_t> _masks;
  std::vector<uint32_t> _bits;   // by zone
  std::vector<uint16_t> _zones;  // by bit
  std::vector<Place> _others;
};

}  // namespace salt
