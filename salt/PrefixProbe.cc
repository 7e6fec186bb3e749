#include <algorithm>
#include <numeric>
#include <string_view>

#include "salt/Coding.h"
#include "salt/IndexImpl.h"
#include "salt/Suffix.h"

// Looks for many prefixes at once.
namespace salt {

namespace {

// Goes through each shard once, from prefix to prefix in their order. Between what one prefix found
// and the next thing in the shard there is nothing: prefixes that fall in there need no look, which
// most of a word's neighbours do.
class PrefixProbe {
 public:
  // The prefixes are cut, in order and all different.
  PrefixProbe(const IndexView& view, const std::vector<std::string_view>& prefixes, size_t limit)
      : _view(view), _prefixes(prefixes), _limit(limit), _cursor(view, 0), found(prefixes.size()) {}

  // False when a read failed.
  bool visit(unsigned shard) {
    _cursor.moveTo(static_cast<uint8_t>(shard));
    const std::string_view* before = nullptr;
    bool passed = false;  // the cursor stands behind matches of `before`
    for (size_t i = 0; i < _prefixes.size(); ++i) {
      const std::string_view prefix = _prefixes[i];
      if (found[i].size() == _limit) continue;
      if (before == nullptr || (passed && prefix.starts_with(*before))) {
        _cursor.seek(prefix);
      } else {
        moveOnTo(prefix);
      }
      passed = collect(prefix, &found[i]);
      before = &_prefixes[i];
    }
    counts.fetches += _cursor.suffix.fetches;
    (shard == 0 ? counts.hotReads : counts.pageReads) += _cursor.loads;
    const leveldb::Status status = _cursor.iterator->status();
    if (!status.ok()) Log.error("Error scanning index: {}", status.ToString());
    return status.ok();
  }

 private:
  // From a place that is not behind the first suffix wanted: a step to the next page costs much
  // less than a seek.
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

  // Takes matches up to the limit; true when the cursor has moved.
  bool collect(std::string_view prefix, std::vector<SuffixMeta>* out) {
    bool moved = false;
    for (; out->size() < _limit && matches(prefix); _cursor.next()) {
      moved = true;
      if (!_view.deleted->contains(_cursor.suffix.meta.DocID)) out->push_back(_cursor.suffix.meta);
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

 public:
  std::vector<std::vector<SuffixMeta>> found;
  ScanCounts counts;
};

}  // namespace

std::vector<std::vector<SuffixMeta>> index::ScanPrefixes(const std::vector<std::string>& prefixes,
                                                         size_t limit) const {
  const auto start = Clock::now();
  const IndexView view(*this, true);
  const auto cut = [this](const std::string& prefix) {
    return std::string_view(prefix).substr(0, suffixLength(prefix, op));
  };
  std::vector<std::string_view> sorted;
  sorted.reserve(prefixes.size());
  for (const std::string& prefix : prefixes) sorted.push_back(cut(prefix));
  std::sort(sorted.begin(), sorted.end());
  sorted.erase(std::unique(sorted.begin(), sorted.end()), sorted.end());

  PrefixProbe probe(view, sorted, limit);
  bool good = true;
  for (unsigned shard = 0; good && shard <= view.lastShard(); ++shard) good = probe.visit(shard);
  for (const auto& metas : probe.found) probe.counts.results += metas.size();
  countScan(start, probe.counts);

  std::vector<std::vector<SuffixMeta>> result;
  result.reserve(prefixes.size());
  for (const std::string& prefix : prefixes) {
    const auto at = std::lower_bound(sorted.begin(), sorted.end(), cut(prefix));
    result.push_back(probe.found[static_cast<size_t>(at - sorted.begin())]);
  }
  return result;
}

}  // namespace salt
