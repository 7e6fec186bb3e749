#include "salt/Scanner.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <utility>

#include "salt/Coding.h"
#include "salt/IndexImpl.h"
#include "salt/PostingSet.h"
#include "salt/Suffix.h"

namespace salt {

namespace {

// Scans the hot part and the shards with one iterator. Prefixes are truncated already.
class PrefixScan {
 public:
  explicit PrefixScan(const IndexView& view, size_t iterator = 0)
      : _view(view), _cursor(view, 0, nullptr, iterator) {}

  // Calls `callback` for each suffix until it returns false or a read fails.
  void suffixes(std::string_view prefix, const std::function<bool(const SuffixMeta&)>& callback) {
    for (unsigned shard = 0; shard <= _view.lastShard(); ++shard) {
      if (!visitShard(shard, prefix, [&] { return visitSuffixes(callback); })) return;
    }
  }

  // False when a read has failed, which ends the scan.
  bool hotPlaces(std::string_view prefix, PostingSet* places) {
    return visitShard(0, prefix, [&] { return visitHotPlaces(places); });
  }
  bool pagePlaces(unsigned shard, std::string_view prefix, PostingSet* places) {
    return visitShard(shard, prefix, [&] { return visitPagePlaces(places); });
  }

  [[nodiscard]] Scanner::Counts takeCounts() { return std::exchange(_counts, {}); }

 private:
  // Calls visit() with the cursor at the first suffix not less than the prefix. False when that
  // returns false or a read fails.
  template <typename Visit>
  bool visitShard(unsigned shard, std::string_view prefix, const Visit& visit) {
    _prefix = prefix;
    _cursor.moveTo(static_cast<uint8_t>(shard));
    _cursor.seek(_prefix);
    const bool goOn = visit();
    if (const leveldb::Status status = _cursor.iterator->status(); !status.ok()) {
      Log.error("Error scanning index: {}", status.ToString());
      return false;
    }
    (shard == 0 ? _counts.hotReads : _counts.pageReads) += _cursor.loads;
    _counts.fetches += _cursor.suffix.fetches;
    return goOn;
  }

  bool visitSuffixes(const std::function<bool(const SuffixMeta&)>& callback) {
    for (; matches(); _cursor.next()) {
      if (_view.deleted->contains(_cursor.suffix.meta.DocID)) continue;
      ++_counts.results;
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
  std::string_view _prefix;
  ShardCursor _cursor;
  Scanner::Counts _counts;
  std::vector<Place> _places;
  std::string _page;
};

constexpr unsigned kMaxShardsOnOneThread = 2;  // not worth waking a thread

// What one thread has found for a prefix.
struct Share {
  PostingSet hot;
  PostingSet pages;
  Scanner::Counts counts;

  void add(Share&& other) {
    hot.add(std::move(other.hot));
    pages.add(std::move(other.pages));
    counts += other.counts;
  }
};

// A prefix to scan for. What is known of the pages comes from the cache.
struct Request {
  size_t number;  // in the caller's list
  std::string_view prefix;
  std::shared_ptr<const PostingSet> known;
  std::array<Share, Scanner::kThreads> shares;  // by thread
};

// The parallel parts of one scan, hot part first. Each part takes the next shard that none has
// taken, and scans it for all prefixes.
class PlacesScan {
 public:
  // The requests are sorted by prefix, so that an iterator mostly moves on within a block.
  PlacesScan(const IndexView& view, std::vector<Request>& requests)
      : _view(view), _requests(requests) {
    const bool pages = std::any_of(requests.begin(), requests.end(),
                                   [](const Request& request) { return !request.known; });
    _last = pages ? view.lastShard() : 0;
  }

  [[nodiscard]] unsigned shards() const { return _last + 1; }

  // Each part runs on a thread of its own.
  void scanPart(size_t part) {
    const platform::CrashNote note(_view.idx.crashNotes());
    PrefixScan scan(_view, part);
    for (unsigned shard = _next++; shard <= _last && _complete; shard = _next++) {
      for (Request& request : _requests) {
        Share& share = request.shares[part];
        if (!scanShard(shard, request, &scan, &share)) _complete = false;
        share.counts += scan.takeCounts();
      }
    }
  }

  // Whether no read has failed.
  [[nodiscard]] bool complete() const { return _complete; }

 private:
  bool scanShard(unsigned shard, const Request& request, PrefixScan* scan, Share* share) const {
    if (shard == 0) return scan->hotPlaces(request.prefix, &share->hot);
    return request.known || addPostings(shard, request.prefix, &share->pages) ||
           scan->pagePlaces(shard, request.prefix, &share->pages);
  }

  [[nodiscard]] bool addPostings(unsigned shard, std::string_view prefix,
                                 PostingSet* places) const {
    const auto& postings = *_view.postings;
    return shard < postings.size() && postings[shard] != nullptr &&
           postings[shard]->add(prefix, places);
  }

  const IndexView& _view;
  std::vector<Request>& _requests;
  unsigned _last = 0;
  std::atomic<unsigned> _next{0};
  std::atomic<bool> _complete{true};
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
  PrefixScan scan(view);
  scan.suffixes(prefix.substr(0, suffixLength(prefix, _idx.op)), callback);
  _idx.countScan(Clock::now() - start, scan.takeCounts());
}

std::vector<std::shared_ptr<const FoundPlaces>> Scanner::scanPlaces(
    const std::vector<std::string_view>& prefixes, uint64_t limit) const {
  const auto start = Clock::now();
  const Activity::Work running(_idx.scans());
  const IndexView view(_idx, true, kThreads);
  std::vector<Request> requests;
  for (size_t i = 0; i < prefixes.size(); ++i) {
    const std::string_view prefix = prefixes[i].substr(0, suffixLength(prefixes[i], _idx.op));
    auto known = _scanCache.find(prefix, view.pageGeneration);
    const uint64_t most =
        known ? known->suffixes() + view.metrics.HotSuffixes : view.metrics.Suffixes;
    if (most > limit) continue;
    requests.push_back({i, prefix, std::move(known), {}});
  }
  std::sort(requests.begin(), requests.end(),
            [](const Request& left, const Request& right) { return left.prefix < right.prefix; });
  PlacesScan scan(view, requests);
  runParts(view, scan.shards(), [&scan](size_t part) { scan.scanPart(part); });

  const bool keep = scan.complete() && view.pageGeneration != 0 && !view.metrics.VacuumInProgress;
  std::vector<std::shared_ptr<const FoundPlaces>> result(prefixes.size());
  for (Request& request : requests) {
    Share& share = request.shares.front();
    for (size_t part = 1; part < kThreads; ++part) share.add(std::move(request.shares[part]));
    auto pages = std::move(request.known);
    if (pages == nullptr) {
      share.pages.erase(*view.deleted);  // those of posting lists
      pages = std::make_shared<const PostingSet>(std::move(share.pages));
      if (keep) _scanCache.keep(request.prefix, view.pageGeneration, pages);
    }
    auto found = std::make_shared<const FoundPlaces>(
        std::make_shared<const PostingSet>(std::move(share.hot)), std::move(pages));
    share.counts.results = found->suffixes();
    _idx.countScan((Clock::now() - start) / requests.size(), share.counts);
    result[request.number] = std::move(found);
  }
  return result;
}

void Scanner::runParts(const IndexView& view, unsigned shards,
                       const std::function<void(size_t part)>& part) const {
  if (shards <= kMaxShardsOnOneThread || view.iterators.size() == 1) {
    part(0);
  } else {
    _runner.run(part);
  }
}

}  // namespace salt
