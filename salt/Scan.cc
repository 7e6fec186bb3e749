#include <algorithm>

#include "salt/Coding.h"
#include "salt/IndexImpl.h"
#include "salt/PlaceSet.h"
#include "salt/Suffix.h"

// The reading half of the index.
namespace salt {

// What a scan adds to the metrics.
struct ScanCounts {
  uint64_t results = 0;
  uint64_t fetches = 0;
  uint64_t hotReads = 0;
  uint64_t pageReads = 0;
};

namespace {

// A scan of all shards for one prefix, cut already.
class PrefixScan {
 public:
  PrefixScan(const IndexView& view, std::string_view prefix)
      : _view(view), _prefix(prefix), _cursor(view, 0) {}

  // Calls `callback` for each suffix, until it returns false or a read fails.
  void suffixes(const std::function<bool(const SuffixMeta&)>& callback) {
    for (unsigned shard = 0; shard <= _view.lastShard(); ++shard) {
      if (!visitShard(shard, [&] { return visitSuffixes(callback); })) return;
    }
  }

  // Both are false when a read has failed, which ends the scan.
  bool hotPlaces(PlaceSet* places) {
    return visitShard(0, [&] { return visitHotPlaces(places); });
  }
  bool pagePlaces(PlaceSet* places) {
    bool good = true;
    for (unsigned shard = 1; good && shard <= _view.lastShard(); ++shard) {
      good = visitShard(shard, [&] { return visitPagePlaces(places); });
    }
    return good;
  }

  ScanCounts counts;

 private:
  // Calls visit() with the cursor on the first suffix from the prefix on. False when that returns
  // false or a read fails.
  template <typename Visit>
  bool visitShard(unsigned shard, const Visit& visit) {
    _cursor.moveTo(static_cast<uint8_t>(shard));
    _cursor.seek(_prefix);
    const bool goOn = visit();
    if (const leveldb::Status status = _cursor.iterator->status(); !status.ok()) {
      Log.error("Error scanning index: {}", status.ToString());
      return false;
    }
    (shard == 0 ? counts.hotReads : counts.pageReads) += _cursor.loads;
    counts.fetches += _cursor.suffix.fetches;
    return goOn;
  }

  bool visitSuffixes(const std::function<bool(const SuffixMeta&)>& callback) {
    for (; matches(); _cursor.next()) {
      if (_view.deleted->contains(_cursor.suffix.meta.DocID)) continue;
      ++counts.results;
      if (!callback(_cursor.suffix.meta)) return false;
    }
    return true;
  }

  bool visitHotPlaces(PlaceSet* places) {
    for (; matches(); _cursor.next()) add(_cursor.suffix.meta, places);
    return true;
  }

  // Within a page a suffix matches as long as it shares the whole prefix with the one before. When
  // the next page begins with a match, all of this one are matches, and most of its columns need no
  // look.
  bool visitPagePlaces(PlaceSet* places) {
    if (!matches()) return true;
    bool more = addMatches(_cursor.pos, places) && nextPageMatches();
    while (more) {
      ++_cursor.loads;
      _page = view(_cursor.iterator->value());
      more = nextPageMatches();
      if (more) {
        readPlaces(_page, _view.idx.op, &_places);
        for (const Place& place : _places) add(place, places);
      } else {
        valueToPage(_page, _view.idx.op, &_cursor.metas);
        addMatches(0, places);
      }
    }
    return true;
  }

  // Adds the cursor's suffixes from `first`, which matches, to the last that does. True when that
  // is the last of the page.
  bool addMatches(size_t first, PlaceSet* places) {
    const std::vector<SuffixMeta>& metas = _cursor.metas;
    size_t at = first;
    for (; at < metas.size() && (at == first || metas[at].lcp >= _prefix.size()); ++at) {
      add(metas[at], places);
    }
    return at == metas.size();
  }

  template <typename Standing>
  void add(const Standing& at, PlaceSet* places) const {
    if (_view.deleted->contains(at.DocID)) return;
    places->add({at.DocID, at.ZoneID});
  }

  bool matches() { return _cursor.valid && _cursor.suffix.compareWithPrefix(_prefix) == 0; }

  // Steps the iterator, and the iterator alone.
  bool nextPageMatches() {
    leveldb::Iterator& iterator = *_cursor.iterator;
    iterator.Next();
    if (!iterator.Valid()) return false;
    const std::string_view key = view(iterator.key());
    return static_cast<uint8_t>(key.front()) == _cursor.shard &&
           key.substr(1, _prefix.size()) == _prefix;
  }

  const IndexView& _view;
  const std::string_view _prefix;
  ShardCursor _cursor;
  std::vector<Place> _places;
  std::string _page;
};

}  // namespace

bool index::ScanPrefix(std::string_view prefix,
                       std::function<bool(const SuffixMeta&)> callback) const {
  const auto start = Clock::now();
  const IndexView view(*this, true);
  PrefixScan scan(view, prefix.substr(0, suffixLength(prefix, op)));
  scan.suffixes(callback);
  countScan(start, scan.counts);
  return true;
}

std::optional<uint64_t> index::ScanPlaces(
    std::string_view prefix, uint64_t limit,
    const std::function<void(const Place* places, size_t count)>& callback) const {
  const auto start = Clock::now();
  const IndexView view(*this, true);
  prefix = prefix.substr(0, suffixLength(prefix, op));
  const auto known = _scanMemory.find(prefix, view.pageGeneration);
  const uint64_t most = known ? known->suffixes + view.metrics.HotSuffixes : view.metrics.Suffixes;
  if (most > limit) return std::nullopt;
  PrefixScan scan(view, prefix);
  PlaceSet hot;
  const bool good = scan.hotPlaces(&hot);
  hot.deliver(callback);
  scan.counts.results = hot.suffixes();
  if (good && known) {
    PlaceSet::deliver(known->places, callback);
    scan.counts.results += known->suffixes;
  } else if (good) {
    PlaceSet pages;
    const bool complete = scan.pagePlaces(&pages);
    pages.deliver(callback);
    scan.counts.results += pages.suffixes();
    if (complete && !view.metrics.VacuumInProgress) remember(prefix, view, pages);
  }
  countScan(start, scan.counts);
  return scan.counts.results;
}

void index::remember(std::string_view prefix, const IndexView& view, const PlaceSet& pages) const {
  ScanMemory::Found found{pages.suffixes(), pages.encode()};
  if (found.places.empty()) return;
  _scanMemory.keep(prefix, view.pageGeneration,
                   std::make_shared<const ScanMemory::Found>(std::move(found)));
}

void index::countScan(Clock::time_point start, const ScanCounts& counts) const {
  const std::chrono::nanoseconds elapsed = Clock::now() - start;
  platform::MutexLock lock(_metricsMutex);
  metrics.Scans += 1;
  metrics.ScanSeconds += static_cast<double>(elapsed.count()) / 1000000000;
  metrics.ScanResults += counts.results;
  metrics.ScanTextFetches += counts.fetches;
  metrics.ScanHotReads += counts.hotReads;
  metrics.ScanPageReads += counts.pageReads;
}

void index::ForEachZone(
    std::function<bool(uint32_t docID, uint16_t zoneID, std::string_view text)> callback) const {
  forEachZone(IndexView(*this, false), callback);
}

void index::forEachZone(
    const IndexView& view,
    const std::function<bool(uint32_t, uint16_t, std::string_view)>& callback) const {
  leveldb::Iterator* const iterator = view.iterator.get();
  for (iterator->Seek(slice(textKey(0, 0).view())); iterator->Valid(); iterator->Next()) {
    uint32_t docID = 0;
    uint16_t zoneID = 0;
    if (!parseTextKey(salt::view(iterator->key()), &docID, &zoneID)) continue;
    if (view.deleted->contains(docID)) continue;
    if (!callback(docID, zoneID, salt::view(iterator->value()))) return;
  }
}

}  // namespace salt
