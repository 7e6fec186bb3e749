#include "salt/IndexView.h"

#include <algorithm>

#include "salt/Coding.h"
#include "salt/IndexImpl.h"

namespace salt {

IndexView::IndexView(const index& owner, bool fillCache, size_t iteratorCount)
    : idx(owner),
      options(readOptions(fillCache)),
      _compactionsEnded(fillCache ? 0 : owner.compactionsEnded()),
      _note(owner.crashNotes()) {
  owner.take(this, iteratorCount, fillCache);
}

// A compaction on demand, which may be the last work for a long time, does not remove files that an
// open iterator reads. Scans are too short to matter.
IndexView::~IndexView() {
  iterators.clear();
  if (!options.fill_cache && idx.compactionsEnded() != _compactionsEnded) {
    idx.removeObsoleteFilesLater();
  }
}

uint8_t IndexView::lastShard() const {
  return static_cast<uint8_t>(std::min<uint64_t>(metrics.Shards, kMaxShardNumber));
}

void IndexView::forEachZone(
    const std::function<bool(uint32_t, uint16_t, std::string_view)>& callback) const {
  leveldb::Iterator* const iterator = iterators.front().get();
  for (iterator->Seek(slice(index::textKey(0, 0).view())); iterator->Valid(); iterator->Next()) {
    uint32_t docID = 0;
    uint16_t zoneID = 0;
    if (!parseTextKey(view(iterator->key()), &docID, &zoneID)) continue;
    if (deleted->contains(docID)) continue;
    if (!callback(docID, zoneID, view(iterator->value()))) return;
  }
}

}  // namespace salt
