#include "salt/Merge.h"

#include <algorithm>
#include <cstring>

namespace salt {

Merge::Merge(index& owner, uint8_t shard, bool hot)
    : _idx(owner),
      _shard(shard),
      _pace(owner.scans()),
      _oldView(owner, false),
      _hotView(owner, false),
      _zoneTexts(owner),
      _old(_oldView, shard, &_zoneTexts),
      _hot(_hotView, 0),
      _previous(owner, &_zoneTexts),
      _first(owner, &_zoneTexts),
      _postings(owner.path(), owner.op.MaxShardSuffixes),
      _withHot(hot) {}

bool Merge::run() {
  const size_t pageSuffixes = _idx.op.MaxPageSuffixes;
  _old.seekToFirst();
  if (_withHot) _hot.seekToFirst();
  while (!_failed && !_interrupted && (_old.valid || _hot.valid)) {
    if (_pending.size() >= 2 * pageSuffixes) {
      flushPage(pageSuffixes);
      if (!_tookOld) commit(false);
    }
    if (oldIsNext()) {
      takeOld();
    } else {
      takeHot();
    }
  }
  if (!_interrupted) commit(true);
  return !_failed && !_interrupted;
}

bool Merge::oldIsNext() {
  if (!_old.valid || !_hot.valid) return _old.valid;
  Suffix& old = _old.suffix;
  const std::string_view hot = _hot.suffix.knownText();  // always the full text
  for (size_t equal = 0;;) {
    const std::string_view known = old.knownText();
    const size_t shorter = std::min(known.size(), hot.size());
    const int order = std::memcmp(known.data() + equal, hot.data() + equal, shorter - equal);
    if (order != 0) return order < 0;
    if (known.size() > hot.size()) return false;
    if (old.full) return known.size() < hot.size() || old.meta < _hot.suffix.meta;
    equal = shorter;
    old.fetch();
  }
}

void Merge::takeOld() {
  const bool pageBegins = _old.pos == 0;
  if (pageBegins) {
    if (_tookOld) commit(false);
    _oldKey = view(_old.iterator->key());
    _oldValue = view(_old.iterator->value());
    --_pageDelta;
  }
  // After the same suffix as before, its common prefix and extra bytes stay valid.
  take(&_old, _lastFromHot || pageBegins);
  _lastFromHot = false;
  _tookOld = true;
}

void Merge::takeHot() {
  _batch.Delete(_hot.iterator->key());
  ++_hotMerged;
  take(&_hot, true);
  _lastFromHot = true;
}

void Merge::take(ShardCursor* cursor, bool relateToPrevious) {
  Suffix& suffix = cursor->suffix;
  _pending.push_back(suffix.meta);
  size_t lcp = suffix.meta.lcp;
  if (relateToPrevious) {
    lcp = commonPrefix(&suffix, &_previous);
    if (_pending.size() > 1) relate(&suffix, lcp, &_pending.back());
  }
  _postings.take(lcp, {suffix.meta.DocID, suffix.meta.ZoneID},
                 [this](size_t bytes) { return previousText(bytes); });
  if (_pendingTexts.size() < _pending.size()) _pendingTexts.emplace_back();
  _pendingTexts[_pending.size() - 1] = suffix.full ? suffix.knownText() : "";
  _previous = suffix;
  cursor->next();
}

std::string_view Merge::previousText(size_t bytes) {
  if (_previous.size < bytes) _previous.fetch();
  return _previous.knownText().substr(0, bytes);
}

bool Merge::finishPostings() {
  return _postings.finish([this](size_t bytes) { return previousText(bytes); });
}

std::string_view Merge::firstText() {
  if (!_pendingTexts.front().empty()) return _pendingTexts.front();
  _first.meta = _pending.front();
  _first.size = 0;
  _first.full = false;
  _first.fetch();
  return _first.knownText();
}

void Merge::flushPage(size_t count) {
  TL_ASSERT(_pending.size() >= count);
  if (_withHot) putPage(count);
  ++_pageDelta;
  _pace.giveWay();
  _interrupted = _idx.interrupted();
  const auto taken = static_cast<ptrdiff_t>(count);
  _pending.erase(_pending.begin(), _pending.begin() + taken);
  std::rotate(_pendingTexts.begin(), _pendingTexts.begin() + taken, _pendingTexts.end());
}

// The first new page written after an old one begins replaces it, mostly with the same key. If the
// value is the same too, there is nothing to write.
void Merge::putPage(size_t count) {
  suffixKey(_shard, firstText(), _pending.front(), &_key);
  pageToValue(_pending.data(), count, &_value);
  const bool replaces = !_oldKey.empty();
  if (replaces && _oldKey != _key) _batch.Delete(_oldKey);
  if (!replaces || _oldKey != _key || _oldValue != _value) _batch.Put(_key, _value);
  _oldKey.clear();
}

// A remainder too long for one page becomes two of about the same size.
void Merge::commit(bool final) {
  if (!_old.iterator->status().ok() || !_hot.iterator->status().ok()) _failed = true;
  if (_failed) return;
  if (_pending.size() > _idx.op.MaxPageSuffixes) flushPage(_pending.size() / 2);
  if (!_pending.empty()) flushPage(_pending.size());
  if (!_zoneTexts.good()) _failed = true;
  if (_failed || (!final && _batch.ApproximateSize() < _idx.op.MaxBatchBytes)) return;
  if (!_idx.commitMerge(&_batch, _hotMerged, _pageDelta)) _failed = true;
  _hotMerged = 0;
  _pageDelta = 0;
}

}  // namespace salt
