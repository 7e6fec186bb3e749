#include "salt/Scanner.h"

#include <algorithm>
#include <array>
#include <atomic>

#include "salt/Coding.h"
#include "salt/IndexImpl.h"
#include "salt/PostingSet.h"
#include "salt/Suffix.h"

namespace salt {

namespace {

// Scans the hot part and the shards for one prefix, which is truncated already.
class PrefixScan {
 public:
  PrefixScan(const IndexView& view, std::string_view prefix, size_t iterator = 0)
      : _view(view), _prefix(prefix), _cursor(view, 0, nullptr, iterator) {}

  // Calls `callback` for each suffix until it returns false or a read fails.
  void suffixes(const std::function<bool(const SuffixMeta&)>& callback) {
    for (unsigned shard = 0; shard <= _view.lastShard(); ++shard) {
      if (!visitShard(shard, [&] { return visitSuffixes(callback); })) return;
    }
  }

  // False when a read has failed, which ends the scan.
  bool hotPlaces(PostingSet* places) {
    return visitShard(0, [&] { return visitHotPlaces(places); });
  }
  bool pagePlaces(unsigned shard, PostingSet* places) {
    return visitShard(shard, [&] { return visitPagePlaces(places); });
  }

  Scanner::Counts counts;

 private:
  // Calls visit() with the cursor at the first suffix not less than the prefix. False when that
  // returns false or a read fails.
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

  bool visitHotPlaces(PostingSet* places) {
    for (; matches(); _cursor.next()) add(_cursor.suffix.meta, places);
    return true;
  }

  // Within a page a suffix matches as long as it shares the whole prefix with the previous one. If
  // the next page begins with a match, the rest of this page matches, and most of its columns need
  // not be read.
  bool visitPagePlaces(PostingSet* places) {
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

  // Adds the cursor's suffixes from `first`, a match, to the last match. True when that is the last
  // suffix of the page.
  bool addMatches(size_t first, PostingSet* places) {
    const std::vector<SuffixMeta>& metas = _cursor.metas;
    size_t at = first;
    for (; at < metas.size() && (at == first || metas[at].lcp >= _prefix.size()); ++at) {
      add(metas[at], places);
    }
    return at == metas.size();
  }

  template <typename Standing>
  void add(const Standing& at, PostingSet* places) const {
    if (_view.deleted->contains(at.DocID)) return;
    places->add({at.DocID, at.ZoneID});
  }

  bool matches() { return _cursor.valid && _cursor.suffix.compareWithPrefix(_prefix) == 0; }

  // Moves the iterator only; the cursor's suffix stays.
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

constexpr unsigned kMaxShardsOnOneThread = 2;  // not worth waking a thread

// The result of a scan for places.
struct FoundPlaces {
  PostingSet hot;
  PostingSet pages;
  bool complete = true;  // no read has failed
  Scanner::Counts counts;

  void add(FoundPlaces&& other) {
    hot.add(std::move(other.hot));
    pages.add(std::move(other.pages));
    complete = complete && other.complete;
    counts += other.counts;
  }
};

// The parallel parts of one scan, hot part first. Each part takes the next shard that none has
// taken.
class PlacesScan {
 public:
  PlacesScan(const IndexView& view, std::string_view prefix, bool withPages)
      : _view(view), _prefix(prefix), _last(withPages ? view.lastShard() : 0) {}

  [[nodiscard]] unsigned shards() const { return _last + 1; }

  // Each part runs on a thread of its own.
  void scanPart(size_t number) {
    const platform::CrashNote note(_view.idx.crashNotes());
    FoundPlaces& found = _found[number];
    PrefixScan scan(_view, _prefix, number);
    for (unsigned shard = _next++; shard <= _last && found.complete; shard = _next++) {
      if (shard == 0) {
        found.complete = scan.hotPlaces(&found.hot);
      } else if (!addPostings(shard, &found.pages)) {
        found.complete = scan.pagePlaces(shard, &found.pages);
      }
    }
    found.counts = scan.counts;
  }

  [[nodiscard]] FoundPlaces take() {
    for (size_t number = 1; number < Scanner::kThreads; ++number) {
      _found.front().add(std::move(_found[number]));
    }
    return std::move(_found.front());
  }

 private:
  [[nodiscard]] bool addPostings(unsigned shard, PostingSet* places) const {
    const auto& postings = *_view.postings;
    return shard < postings.size() && postings[shard] != nullptr &&
           postings[shard]->add(_prefix, *_view.deleted, places);
  }

  const IndexView& _view;
  const std::string_view _prefix;
  const unsigned _last;
  std::atomic<unsigned> _next{0};
  std::array<FoundPlaces, Scanner::kThreads> _found;
};

}  // namespace

Scanner::Counts& Scanner::Counts::operator+=(const Counts& other) {
  results += other.results;
  fetches += other.fetches;
  hotReads += other.hotReads;
  pageReads += other.pageReads;
  return *this;
}

void Scanner::scanPrefix(std::string_view prefix,
                         const std::function<bool(const SuffixMeta&)>& callback) const {
  const auto start = Clock::now();
  const Activity::Work running(_idx.scans());
  const IndexView view(_idx, true);
  PrefixScan scan(view, prefix.substr(0, suffixLength(prefix, _idx.op)));
  scan.suffixes(callback);
  _idx.countScan(Clock::now() - start, scan.counts);
}

std::optional<uint64_t> Scanner::scanPlaces(std::string_view prefix, uint64_t limit,
                                            const PlacesCallback& callback) const {
  const auto start = Clock::now();
  const Activity::Work running(_idx.scans());
  const IndexView view(_idx, true, kThreads);
  prefix = prefix.substr(0, suffixLength(prefix, _idx.op));
  const auto known = _scanCache.find(prefix, view.pageGeneration);
  const uint64_t most = known ? known->suffixes + view.metrics.HotSuffixes : view.metrics.Suffixes;
  if (most > limit) return std::nullopt;
  PlacesScan scan(view, prefix, !known);
  runParts(view, scan.shards(), [&scan](size_t part) { scan.scanPart(part); });
  const FoundPlaces found = scan.take();
  found.hot.deliver(callback);
  Counts counts = found.counts;
  counts.results = found.hot.suffixes();
  if (known) {
    PostingSet::deliver(known->places, callback);
    counts.results += known->suffixes;
  } else {
    found.pages.deliver(callback);
    counts.results += found.pages.suffixes();
    if (found.complete && view.pageGeneration != 0 && !view.metrics.VacuumInProgress) {
      remember(prefix, view, found.pages);
    }
  }
  _idx.countScan(Clock::now() - start, counts);
  return counts.results;
}

void Scanner::runParts(const IndexView& view, unsigned shards,
                       const std::function<void(size_t part)>& part) const {
  if (shards <= kMaxShardsOnOneThread || view.iterators.size() == 1) {
    part(0);
  } else {
    _runner.run(part);
  }
}

void Scanner::remember(std::string_view prefix, const IndexView& view,
                       const PostingSet& pages) const {
  ScanCache::Found found{pages.suffixes(), pages.encode()};
  if (found.places.empty()) return;
  _scanCache.keep(prefix, view.pageGeneration,
                  std::make_shared<const ScanCache::Found>(std::move(found)));
}

}  // namespace salt
