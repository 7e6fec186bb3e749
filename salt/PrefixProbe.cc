#include <algorithm>
#include <array>
#include <atomic>
#include <string>
#include <string_view>

#include "salt/Coding.h"
#include "salt/IndexImpl.h"
#include "salt/Scanner.h"
#include "salt/Suffix.h"

// Scans for many prefixes at once.
namespace salt {

namespace {

// A suffix that begins with the prefix of this index.
struct Find {
  size_t prefix;
  SuffixMeta meta;
};

// Goes through a shard in the order of the prefixes. There is nothing in the shard between the last
// match of one prefix and the next suffix, so prefixes that fall in between need no look. Most
// neighbours of a word do.
class PrefixProbe {
 public:
  // The prefixes are truncated, sorted and distinct. `iterator` is an index into the
  // iterators of the view.
  PrefixProbe(const IndexView& view, const std::vector<std::string_view>& prefixes, size_t limit,
              size_t iterator)
      : _view(view), _prefixes(prefixes), _limit(limit), _cursor(view, 0, nullptr, iterator) {}

  // Appends the first `limit` suffixes of each prefix. False, with a log line, when a read failed.
  bool visit(unsigned shard, std::vector<Find>* found) {
    _cursor.moveTo(static_cast<uint8_t>(shard));
    bool passed = false;  // the cursor stands after matches of the previous prefix
    for (size_t i = 0; i < _prefixes.size(); ++i) {
      if (i == 0 || (passed && _prefixes[i].starts_with(_prefixes[i - 1]))) {
        _cursor.seek(_prefixes[i]);
      } else {
        moveOnTo(_prefixes[i]);
      }
      passed = collect(i, found);
    }
    counts.fetches += _cursor.suffix.fetches;
    (shard == 0 ? counts.hotReads : counts.pageReads) += _cursor.loads;
    const leveldb::Status status = _cursor.iterator->status();
    if (!status.ok()) Log.error("Error scanning index: {}", status.ToString());
    return status.ok();
  }

  Scanner::Counts counts;

 private:
  // Moves on from a position at or before the first match: stepping to the next page is much
  // cheaper than a seek.
  void moveOnTo(std::string_view prefix) {
    const auto before = [&] {
      return _cursor.valid && _cursor.suffix.compareWithPrefix(prefix) < 0;
    };
    while (before()) {
      const bool pageEnds = _cursor.pos + 1 >= _cursor.metas.size();
      _cursor.next();
      if (pageEnds && before()) return _cursor.seek(prefix);
    }
  }

  // Collects matches up to the limit; true when the cursor has moved.
  bool collect(size_t prefix, std::vector<Find>* found) {
    bool moved = false;
    for (size_t taken = 0; taken < _limit && matches(_prefixes[prefix]); _cursor.next()) {
      moved = true;
      if (_view.deleted->contains(_cursor.suffix.meta.DocID)) continue;
      found->push_back({prefix, _cursor.suffix.meta});
      ++taken;
    }
    return moved;
  }

  bool matches(std::string_view prefix) {
    return _cursor.valid && _cursor.suffix.compareWithPrefix(prefix) == 0;
  }

  const IndexView& _view;
  const std::vector<std::string_view>& _prefixes;
  const size_t _limit;
  ShardCursor _cursor;
};

// Merges the results of all shards, in shard order, for `prefixes` prefixes.
std::vector<std::vector<SuffixMeta>> firstOfEach(const std::vector<std::vector<Find>>& byShard,
                                                 size_t prefixes, size_t limit) {
  std::vector<std::vector<SuffixMeta>> first(prefixes);
  for (const auto& finds : byShard) {
    for (const Find& find : finds) {
      if (first[find.prefix].size() < limit) first[find.prefix].push_back(find.meta);
    }
  }
  return first;
}

}  // namespace

void Scanner::learnStarts() const {
  _idx.starts().beginWith([this](const std::function<bool(std::string_view)>& enter) {
    _idx.waitForZoneInHand();
    const IndexView view(_idx, false);
    bool all = true;
    view.forEachZone([&](uint32_t, uint16_t, std::string_view text) { return all = enter(text); });
    return all && view.iterators.front()->status().ok();
  });
}

std::vector<std::vector<SuffixMeta>> Scanner::scanPrefixes(const std::vector<std::string>& prefixes,
                                                           size_t limit) const {
  const auto start = Clock::now();
  const Activity::Work running(_idx.scans());
  if (!_idx.starts().complete()) learnStarts();
  const IndexView view(_idx, true, kThreads);
  const auto cut = [this](const std::string& prefix) {
    return std::string_view(prefix).substr(0, suffixLength(prefix, _idx.op));
  };
  std::vector<std::string_view> sorted;
  sorted.reserve(prefixes.size());
  for (const std::string& prefix : prefixes) {
    if (_idx.starts().mayBegin(cut(prefix))) sorted.push_back(cut(prefix));
  }
  std::sort(sorted.begin(), sorted.end());
  sorted.erase(std::unique(sorted.begin(), sorted.end()), sorted.end());

  std::vector<std::vector<Find>> byShard(view.lastShard() + size_t{1});
  std::atomic<size_t> next{0};
  std::array<Counts, kThreads> counts;
  runParts(view, view.lastShard() + 1U, [&](size_t part) {
    PrefixProbe probe(view, sorted, limit, part);
    bool good = true;
    for (size_t shard = next++; good && shard < byShard.size(); shard = next++) {
      good = probe.visit(static_cast<unsigned>(shard), &byShard[shard]);
    }
    counts[part] = probe.counts;
  });

  const auto found = firstOfEach(byShard, sorted.size(), limit);
  Counts all;
  for (const Counts& one : counts) all += one;
  for (const auto& metas : found) all.results += metas.size();
  _idx.countScan(Clock::now() - start, all);

  std::vector<std::vector<SuffixMeta>> result;
  result.reserve(prefixes.size());
  for (const std::string& prefix : prefixes) {
    const auto at = std::lower_bound(sorted.begin(), sorted.end(), cut(prefix));
    const bool looked = at != sorted.end() && *at == cut(prefix);
    result.push_back(looked ? found[static_cast<size_t>(at - sorted.begin())]
                            : std::vector<SuffixMeta>());
  }
  return result;
}

}  // namespace salt
