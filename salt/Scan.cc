#include <algorithm>

#include "salt/Coding.h"
#include "salt/IndexImpl.h"
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

// Hot suffixes that go to the callback together.
constexpr size_t kHotRun = 256;

using PlaceCallback = std::function<bool(const Place* places, size_t count)>;

// A scan of all shards for one prefix, cut already.
class PrefixScan {
 public:
  PrefixScan(const IndexView& view, std::string_view prefix)
      : _view(view), _prefix(prefix), _cursor(view, 0) {}

  // Calls visit() with the cursor on each shard's first suffix from the prefix on, until it returns
  // false or a read fails.
  template <typename Visit>
  void overShards(const Visit& visit) {
    bool goOn = true;
    for (unsigned shard = 0; goOn && shard <= _view.lastShard(); ++shard) {
      _cursor.moveTo(static_cast<uint8_t>(shard));
      _cursor.seek(_prefix);
      goOn = visit();
      if (const leveldb::Status status = _cursor.iterator->status(); !status.ok()) {
        Log.error("Error scanning index: {}", status.ToString());
        return;
      }
      (shard == 0 ? counts.hotReads : counts.pageReads) += _cursor.loads;
      counts.fetches += _cursor.suffix.fetches;
    }
  }

  bool visitSuffixes(const std::function<bool(const SuffixMeta&)>& callback) {
    for (; matches(); _cursor.next()) {
      if (_view.deleted->contains(_cursor.suffix.meta.DocID)) continue;
      ++counts.results;
      if (!callback(_cursor.suffix.meta)) return false;
    }
    return true;
  }

  bool visitPlaces(size_t limit, const PlaceCallback& callback) {
    _limit = limit;
    return _cursor.shard == 0 ? visitHotPlaces(callback) : visitPagePlaces(callback);
  }

  ScanCounts counts;

 private:
  bool matches() { return _cursor.valid && _cursor.suffix.compareWithPrefix(_prefix) == 0; }

  bool visitHotPlaces(const PlaceCallback& callback) {
    for (; matches(); _cursor.next()) {
      const SuffixMeta& meta = _cursor.suffix.meta;
      _places.push_back({meta.DocID, meta.ZoneID});
      if (_places.size() == kHotRun && !deliver(callback)) return false;
    }
    return deliver(callback);
  }

  // Within a page a suffix matches as long as it shares the whole prefix with the one before. When
  // the next page begins with a match, all of this one are matches, and most of its columns need no
  // look.
  bool visitPagePlaces(const PlaceCallback& callback) {
    if (!matches()) return true;
    if (!addMatches(_cursor.pos)) return deliver(callback);
    bool more = nextPageMatches();
    while (deliver(callback)) {
      if (!more) return true;
      ++_cursor.loads;
      _page = view(_cursor.iterator->value());
      more = nextPageMatches();
      if (more) {
        appendPlaces(_page, _view.idx.op, &_places);
      } else {
        valueToPage(_page, _view.idx.op, &_cursor.metas);
        addMatches(0);
      }
    }
    return false;
  }

  // Adds the cursor's suffixes from `first`, which matches, to the last that does. True when that
  // is the last of the page.
  bool addMatches(size_t first) {
    const std::vector<SuffixMeta>& metas = _cursor.metas;
    size_t at = first;
    for (; at < metas.size() && (at == first || metas[at].lcp >= _prefix.size()); ++at) {
      _places.push_back({metas[at].DocID, metas[at].ZoneID});
    }
    return at == metas.size();
  }

  // Steps the iterator, and the iterator alone.
  bool nextPageMatches() {
    leveldb::Iterator& iterator = *_cursor.iterator;
    iterator.Next();
    if (!iterator.Valid()) return false;
    const std::string_view key = view(iterator.key());
    return static_cast<uint8_t>(key.front()) == _cursor.shard &&
           key.substr(1, _prefix.size()) == _prefix;
  }

  // Hands the places of live documents over.
  bool deliver(const PlaceCallback& callback) {
    if (_view.deleted->size() != 0) {
      std::erase_if(_places, [&](const Place& p) { return _view.deleted->contains(p.DocID); });
    }
    if (_places.empty()) return true;
    const size_t count = std::min<size_t>(_places.size(), _limit - counts.results);
    counts.results += count;
    const bool goOn = callback(_places.data(), count) && counts.results < _limit;
    _places.clear();
    return goOn;
  }

  const IndexView& _view;
  const std::string_view _prefix;
  ShardCursor _cursor;
  size_t _limit = 0;
  std::vector<Place> _places;
  std::string _page;
};

}  // namespace

bool index::ScanPrefix(std::string_view prefix,
                       std::function<bool(const SuffixMeta&)> callback) const {
  const auto start = Clock::now();
  const IndexView view(*this, true);
  PrefixScan scan(view, prefix.substr(0, suffixLength(prefix, op)));
  scan.overShards([&] { return scan.visitSuffixes(callback); });
  countScan(start, scan.counts);
  return true;
}

bool index::ScanPlaces(
    std::string_view prefix, size_t limit,
    const std::function<bool(const Place* places, size_t count)>& callback) const {
  const auto start = Clock::now();
  const IndexView view(*this, true);
  PrefixScan scan(view, prefix.substr(0, suffixLength(prefix, op)));
  scan.overShards([&] { return scan.visitPlaces(limit, callback); });
  countScan(start, scan.counts);
  return true;
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
