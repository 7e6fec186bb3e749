#pragma once

#include <algorithm>
#include <array>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Mutex.h"
#include "salt/DocPages.h"
#include "salt/Index.h"

namespace salt {

// Assigns bits to the first 32 zones that the scans of an index meet, so that the zone masks of all
// its posting sets mean the same. A mail has about ten zones. Any thread.
class ZoneBitTable {
 public:
  // The bit of a zone; 0 when none is left.
  [[nodiscard]] uint32_t bitOf(uint16_t zoneID) TL_EXCLUDES(_mutex);
  // By bit.
  [[nodiscard]] std::vector<uint16_t> zones() const TL_EXCLUDES(_mutex);

 private:
  static constexpr size_t kMaxZones = 32;

  mutable platform::Mutex _mutex;
  std::vector<uint16_t> _zones TL_GUARDED_BY(_mutex);
};

// The distinct places of many suffixes, as zone masks by document, and the number of suffixes.
// Built by one thread; then any thread may read it.
class PostingSet {
 public:
  // The table outlives it.
  explicit PostingSet(ZoneBitTable& table) : _table(&table) {}

  void add(const Place& place) {
    ++_suffixes;
    const uint32_t bit = bitOf(place.ZoneID);
    if (bit == 0) {
      _others.push_back(place);
    } else {
      _masks[place.DocID] |= bit;
    }
  }

  // The two sets must have the same table and not count the same suffix.
  void add(PostingSet&& other);

  // Adds documents that have the zones of one of `masks`, whose bits index `zones`. Their suffixes
  // are counted separately, by addSuffixes. Set and lists outlive it.
  class Adder {
   public:
    Adder(PostingSet* set, const std::vector<uint16_t>& zones, const std::vector<uint32_t>& masks);

    // Adds a document with the zones of masks[mask].
    void add(uint32_t docID, size_t mask) {
      if (_translated.empty()) {
        addOneByOne(docID, _masks[mask]);
      } else {
        _set._masks[docID] |= _translated[mask];
      }
    }

   private:
    void addOneByOne(uint32_t docID, uint32_t mask);

    PostingSet& _set;
    const std::vector<uint16_t>& _zones;
    const std::vector<uint32_t>& _masks;
    std::vector<uint32_t> _translated;  // the masks in bits of the table; empty if it has too few
  };
  void addSuffixes(uint64_t count) { _suffixes += count; }

  [[nodiscard]] uint64_t suffixes() const { return _suffixes; }

  // The zones of each document as bits of the table, 0 for none.
  [[nodiscard]] const DocPages<uint32_t>& masks() const { return _masks; }
  [[nodiscard]] uint32_t mask(uint32_t docID) const { return _masks.at(docID); }
  // Calls visit(docID, mask) in DocID order for each document with a mask.
  template <typename Visit>
  void forEach(const Visit& visit) const {
    _masks.forEach([&visit](uint32_t docID, uint32_t mask) {
      if (mask != 0) visit(docID, mask);
    });
  }
  // The places in zones without a bit, as often as they were added.
  [[nodiscard]] const std::vector<Place>& others() const { return _others; }
  [[nodiscard]] ZoneBitTable& table() const { return *_table; }

  [[nodiscard]] size_t bytes() const { return _masks.bytes() + sizeof *this; }

  // The masks in compact form, and back; without suffixes and others.
  [[nodiscard]] std::string encode() const;
  void addEncoded(std::string_view encoded);

 private:
  [[nodiscard]] uint32_t bitOf(uint16_t zoneID) {
    const uint32_t bit = zoneID < _bits.size() ? _bits[zoneID] : 0;
    return bit != 0 ? bit : newBit(zoneID);
  }
  uint32_t newBit(uint16_t zoneID);

  ZoneBitTable* _table;
  uint64_t _suffixes = 0;
  DocPages<uint32_t> _masks;
  std::vector<uint32_t> _bits;  // by zone, as far as the set has met it
  std::vector<Place> _others;
};

// The masks of the documents of one page.
using MaskPage = std::array<uint32_t, DocPages<uint32_t>::kPageDocs>;

// What a scan has found for one prefix. Any thread; the index outlives it.
class FoundPlaces {
 public:
  FoundPlaces(std::shared_ptr<const PostingSet> hot, std::shared_ptr<const PostingSet> pages)
      : _hot(std::move(hot)), _pages(std::move(pages)) {}

  // The number of matching suffixes.
  [[nodiscard]] uint64_t suffixes() const { return _hot->suffixes() + _pages->suffixes(); }

  // Calls `callback` with batches of places, in any order, each place at least once.
  void deliver(const PlacesCallback& callback) const;

  // Whether each place is in a mask.
  [[nodiscard]] bool hasAllInMasks() const {
    return _hot->others().empty() && _pages->others().empty();
  }
  // The zones that the bits of masks stand for.
  [[nodiscard]] std::vector<uint16_t> zones() const { return _hot->table().zones(); }
  [[nodiscard]] uint32_t mask(uint32_t docID) const {
    return _hot->mask(docID) | _pages->mask(docID);
  }
  // Calls visit(docID, mask) once for each document with a mask.
  template <typename Visit>
  void forEach(const Visit& visit) const {
    _pages->forEach([&](uint32_t docID, uint32_t mask) { visit(docID, mask | _hot->mask(docID)); });
    _hot->forEach([&](uint32_t docID, uint32_t mask) {
      if (_pages->mask(docID) == 0) visit(docID, mask);
    });
  }

  // The number of pages of masks; see DocPages.
  [[nodiscard]] size_t pages() const {
    return std::max(_hot->masks().pages(), _pages->masks().pages());
  }
  // Adds to each of `out` what of `bits` is in the mask of a document of the page. False when no
  // document has a mask.
  bool addPage(size_t page, uint32_t bits, MaskPage* out) const {
    bool some = false;
    for (const auto& set : {_hot.get(), _pages.get()}) {
      const uint32_t* const masks = set->masks().page(page);
      if (masks == nullptr) continue;
      some = true;
      for (size_t i = 0; i < out->size(); ++i) (*out)[i] |= masks[i] & bits;
    }
    return some;
  }

 private:
  std::shared_ptr<const PostingSet> _hot;
  std::shared_ptr<const PostingSet> _pages;
};

}  // namespace salt
