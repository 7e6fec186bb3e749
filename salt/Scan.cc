#include "salt/IndexImpl.h"
#include "salt/Suffix.h"

// The reading half of the index.
namespace salt {

bool index::ScanPrefix(std::string_view prefix,
                       std::function<bool(const SuffixMeta&)> callback) const {
  const auto start = Clock::now();
  const IndexView view(*this, true);
  prefix = prefix.substr(0, suffixLength(prefix, op));
  ShardCursor cursor(view, 0);
  ScanCounts counts;
  bool goOn = true;
  for (unsigned shard = 0; goOn && shard <= view.lastShard(); ++shard) {
    cursor.moveTo(static_cast<uint8_t>(shard));
    goOn = scanShard(&cursor, *view.deleted, prefix, callback, &counts);
  }
  const std::chrono::nanoseconds elapsed = Clock::now() - start;
  platform::MutexLock lock(_metricsMutex);
  metrics.Scans += 1;
  metrics.ScanSeconds += static_cast<double>(elapsed.count()) / 1000000000;
  metrics.ScanResults += counts.results;
  metrics.ScanTextFetches += counts.fetches;
  metrics.ScanHotReads += counts.hotReads;
  metrics.ScanPageReads += counts.pageReads;
  return true;
}

bool index::scanShard(ShardCursor* cursor, const DeletedDocs& deleted, std::string_view prefix,
                      const std::function<bool(const SuffixMeta&)>& callback,
                      ScanCounts* counts) const {
  bool goOn = true;
  for (cursor->seek(prefix); cursor->valid; cursor->next()) {
    if (cursor->suffix.compareWithPrefix(prefix) != 0) break;
    if (deleted.contains(cursor->suffix.meta.DocID)) continue;
    ++counts->results;
    goOn = callback(cursor->suffix.meta);
    if (!goOn) break;
  }
  if (const leveldb::Status status = cursor->iterator->status(); !status.ok()) {
    Log.error("Error scanning index: {}", status.ToString());
    return false;
  }
  (cursor->shard == 0 ? counts->hotReads : counts->pageReads) += cursor->loads;
  counts->fetches += cursor->suffix.fetches;
  return goOn;
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
