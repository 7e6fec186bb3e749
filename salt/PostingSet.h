#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <utility>
#include <vector>

#include "salt/DocSet.h"
#include "salt/Index.h"

namespace salt {

// The distinct places of many suffixes, as a set of documents for each zone, and the number of
// suffixes added. A mail has about ten zones. Built by one thread; then any thread may read it.
class PostingSet {
 public:
  struct Zone {
    uint16_t ZoneID = 0;
    DocSet docs;
  };

  void add(const Place& place) {
    ++_suffixes;
    docsOf(place.ZoneID).insert(place.DocID);
  }

  // The two sets must not count the same suffix.
  void add(PostingSet&& other);
  // Adds documents whose suffixes are counted by addSuffixes, or removes some whose suffixes remain
  // counted.
  void insert(const PostingSet& other);
  void erase(const DocSet& docs);

  // The documents of a zone, to which more may be added; valid until the next zone is asked for.
  // Their suffixes are counted by addSuffixes.
  [[nodiscard]] DocSet& docsOf(uint16_t zoneID) {
    const size_t at = zoneID < _places.size() ? _places[zoneID] : 0;
    return at != 0 ? _zones[at - 1].docs : newZone(zoneID);
  }
  void addSuffixes(uint64_t count) { _suffixes += count; }

  [[nodiscard]] uint64_t suffixes() const { return _suffixes; }
  // In no order.
  [[nodiscard]] const std::vector<Zone>& zones() const { return _zones; }
  // Null for a zone without documents.
  [[nodiscard]] const DocSet* docsOf(uint16_t zoneID) const {
    const size_t at = zoneID < _places.size() ? _places[zoneID] : 0;
    return at != 0 ? &_zones[at - 1].docs : nullptr;
  }

  // Whether there is no document.
  [[nodiscard]] bool empty() const;

  [[nodiscard]] size_t bytes() const;

 private:
  DocSet& newZone(uint16_t zoneID);

  uint64_t _suffixes = 0;
  std::vector<Zone> _zones;
  std::vector<uint32_t> _places;  // by zone: its place in _zones, from 1; 0 for none
};

// What a scan has found for one prefix. Any thread.
class FoundPlaces {
 public:
  FoundPlaces(std::shared_ptr<const PostingSet> hot, std::shared_ptr<const PostingSet> pages)
      : _hot(std::move(hot)), _pages(std::move(pages)) {}

  // The number of matching suffixes; those of deleted documents may be among them.
  [[nodiscard]] uint64_t suffixes() const { return _hot->suffixes() + _pages->suffixes(); }

  // Whether no document matches.
  [[nodiscard]] bool empty() const { return _hot->empty() && _pages->empty(); }

  // Calls visit(zoneID, documents) for the zones with a match; a zone may come twice.
  template <typename Visit>
  void forEachZone(const Visit& visit) const {
    for (const auto& set : {_hot.get(), _pages.get()}) {
      for (const PostingSet::Zone& zone : set->zones()) visit(zone.ZoneID, zone.docs);
    }
  }

 private:
  std::shared_ptr<const PostingSet> _hot;
  std::shared_ptr<const PostingSet> _pages;
};

}  // namespace salt
