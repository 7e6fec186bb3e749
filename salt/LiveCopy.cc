#include "salt/LiveCopy.h"

#include <algorithm>
#include <cerrno>

#include "salt/Coding.h"

namespace salt {

LiveCopy::LiveCopy(const index& from, const std::function<bool(uint32_t)>& isKept,
                   const std::function<void()>& progress)
    : _from(from),
      _isKept(isKept),
      _progress(progress),
      _view(from, false),
      _zoneTexts(from),
      _cursor(_view, 0, &_zoneTexts),
      _previous(from, &_zoneTexts),
      _metrics(_view.metrics) {}

std::optional<uint64_t> LiveCopy::write(const std::string& path, TLErrorOut error) {
  const Database to = openDatabase(path, OpenMode::create);
  _status = to.status;
  if (_status.ok()) {
    _writer.emplace(to);
    copyHotPart();
    for (unsigned shard = 1; shard <= _view.lastShard(); ++shard) {
      copyShard(static_cast<uint8_t>(shard));
    }
    copyTextsAndRecords();
  }
  if (_status.ok()) _status = iterator().status();
  if (_status.ok() && !_zoneTexts.good()) _status = leveldb::Status::IOError(_from.path(), "read");
  if (_status.ok()) _status = _writer->sync();
  if (_status.ok()) return _left;
  Log.error("Error copying db: {}", _status.ToString());
  platform::setError(error,
                     systemError(_status).value_or(platform::posixError(EIO, _status.ToString())));
  return std::nullopt;
}

void LiveCopy::copyHotPart() {
  _metrics.HotSuffixes = 0;
  _cursor.moveTo(0);
  for (_cursor.seekToFirst(); _cursor.valid && _status.ok(); _cursor.next()) {
    if (!isLive(_cursor.suffix.meta.DocID)) continue;
    _batch.Put(iterator().key(), iterator().value());
    ++_metrics.HotSuffixes;
    commit(false);
  }
  _metrics.Suffixes = _metrics.HotSuffixes;
  _metrics.Pages = 0;
}

void LiveCopy::copyShard(uint8_t shard) {
  const size_t pageSuffixes = _from.op.MaxPageSuffixes;
  _shardSuffixes = 0;
  _cursor.moveTo(shard);
  _cursor.seekToFirst();
  while (_cursor.valid && _status.ok()) {
    const auto& metas = _cursor.metas;
    const auto live = static_cast<size_t>(std::count_if(
        metas.begin(), metas.end(), [this](const auto& meta) { return isLive(meta.DocID); }));
    if (_pending.size() + live > pageSuffixes) flushPage();
    if (live == metas.size() && _pending.empty()) {
      putPage(iterator().key(), iterator().value(), live);
      iterator().Next();
      _cursor.load();
    } else {
      takePage(metas.size());
      if (_pending.size() >= (pageSuffixes + 1) / 2) flushPage();
    }
  }
  flushPage();
  if (shard == _metrics.Shards) _metrics.LastShardSuffixes = _shardSuffixes;
}

void LiveCopy::takePage(size_t suffixes) {
  for (size_t i = 0; i < suffixes; ++i) {
    if (isLive(_cursor.suffix.meta.DocID)) take(_cursor.suffix);
    _cursor.next();
  }
}

void LiveCopy::take(Suffix& suffix) {
  _pending.push_back(suffix.meta);
  if (_pending.size() == 1) {
    suffix.fetch();
    suffixKey(_cursor.shard, suffix.knownText(), suffix.meta, &_key);
  } else {
    relate(&suffix, commonPrefix(&suffix, &_previous), &_pending.back());
  }
  _previous = suffix;
}

void LiveCopy::flushPage() {
  if (_pending.empty()) return;
  pageToValue(_pending.data(), _pending.size(), &_value);
  putPage(_key, _value, _pending.size());
  _pending.clear();
}

void LiveCopy::putPage(leveldb::Slice key, leveldb::Slice value, size_t suffixes) {
  _batch.Put(key, value);
  ++_metrics.Pages;
  _metrics.Suffixes += suffixes;
  _shardSuffixes += suffixes;
  commit(false);
}

void LiveCopy::copyTextsAndRecords() {
  uint32_t leftDoc = 0;
  const char first = static_cast<char>(kMaxShardNumber + 1);
  for (iterator().Seek({&first, 1}); iterator().Valid() && _status.ok(); iterator().Next()) {
    uint32_t docID = 0;
    uint16_t zoneID = 0;
    const leveldb::Slice key = iterator().key();
    if (key == kDeletedKey) continue;
    if (parseTextKey(salt::view(key), &docID, &zoneID) && !isLive(docID)) {
      if (docID != leftDoc) ++_left;
      leftDoc = docID;
      continue;
    }
    _batch.Put(key, iterator().value());
    commit(false);
  }
  _metrics.VacuumInProgress = false;
  putMetrics(_metrics, &_batch);
  commit(true);
}

void LiveCopy::commit(bool all) {
  if (!_status.ok() || (!all && _batch.ApproximateSize() < _from.op.MaxBatchBytes)) return;
  _status = _writer->write(&_batch);
  _batch.Clear();
  _progress();
}

}  // namespace salt
