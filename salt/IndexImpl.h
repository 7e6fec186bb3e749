#pragma once

#include <leveldb/db.h>
#include <leveldb/write_batch.h>

#include <atomic>
#include <chrono>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/Mutex.h"
#include "platform/Queue.h"
#include "salt/Coding.h"
#include "salt/Database.h"
#include "salt/DocSet.h"
#include "salt/Index.h"
#include "salt/IndexView.h"
#include "salt/MergeScheduler.h"
#include "salt/Postings.h"
#include "salt/Scanner.h"
#include "salt/SuffixStarts.h"
#include "salt/ZoneWriter.h"

namespace salt {

inline constexpr char kDeletedKey[] =
    "\xFF"
    "DELETED";

// Adds the metrics record to the batch.
void putMetrics(const Index::MetricsBlock& metrics, leveldb::WriteBatch* batch);

// The index over a leveldb database. It owns the state that readers see beside the keys, and every
// change to it goes through here. ZoneWriter, Scanner and MergeScheduler do the work of the
// operations; salt/Schedule.h says which of them waits for which.
//
// Threads. Three locks, taken in this order: the write mutex of ZoneWriter serialises AddZone and
// DeleteDocs; the commit mutex serialises the writes of batches with metrics, which may wait a long
// time for leveldb; the metrics mutex, held only briefly, guards the state and the creation of a
// view, so that no scan waits for a write.
//
// Invariants. The stored metrics always belong to the same batch as the keys they count. Metrics in
// memory change under the commit mutex, except for the scan counts. A view's iterators and its copy
// of the metrics are of the same moment, unless the view is taken during a write: then the metrics
// may already count what the iterators do not see yet. A view does not see later deletions.
class index final : public Index {
 public:
  explicit index(Database opened);
  // Waits for the running merge.
  ~index() override { _merges.schedule().join(); }
  // Opens the index in an existing database; null, with a log line, when there is none or it is
  // unsound; sets the error as LoadIndex does.
  [[nodiscard]] static std::unique_ptr<index> load(Database opened, TLErrorOut error = nullptr);

  [[nodiscard]] const Options& GetOptions() const override { return op; }
  [[nodiscard]] std::string GetSuffixText(const SuffixMeta& meta) const override;
  bool AddZone(uint32_t docID, uint16_t zoneID, std::string_view text,
               std::vector<uint32_t>& offsets, bool merge) override;
  bool DeleteDoc(uint32_t docID) override { return DeleteDocs({docID}); }
  bool DeleteDocs(const std::vector<uint32_t>& docIDs) override {
    return _zoneWriter.deleteDocs(docIDs);
  }
  bool ScanPrefix(std::string_view prefix,
                  std::function<bool(const SuffixMeta&)> callback) const override {
    _scanner.scanPrefix(prefix, callback);
    return true;
  }
  void ForEachZone(std::function<bool(uint32_t docID, uint16_t zoneID, std::string_view text)>
                       callback) const override {
    IndexView(*this, false).forEachZone(callback);
  }
  void Vacuum() override { _merges.mergeAtOnce(); }
  bool Sync() override;
  bool Compact() override { return _merges.compact(); }
  [[nodiscard]] Metrics GetMetrics() const override;
  void ResetScanMetrics() override TL_EXCLUDES(_metricsMutex);
  [[nodiscard]] bool Validate() const override;
  [[nodiscard]] std::string Dump() const override;
  [[nodiscard]] std::vector<std::shared_ptr<const FoundPlaces>> ScanPlaces(
      const std::vector<std::string_view>& prefixes, uint64_t limit) const override {
    return _scanner.scanPlaces(prefixes, limit);
  }
  [[nodiscard]] std::vector<std::vector<SuffixMeta>> ScanPrefixes(
      const std::vector<std::string>& prefixes, size_t limit) const override {
    return _scanner.scanPrefixes(prefixes, limit);
  }
  void WaitForMaintenance() override { _merges.schedule().waitForMaintenance(); }
  void Interrupt() override { _merges.schedule().interrupt(); }
  [[nodiscard]] bool interrupted() const { return _merges.schedule().interrupted(); }

  // The text of Dump in pieces of about 64 KiB. `sink` returns false to stop. False when it did or,
  // with a log line, when reading failed.
  [[nodiscard]] bool dumpTo(const std::function<bool(std::string_view)>& sink) const;

  static TextKey textKey(uint32_t docID, uint16_t zoneID) {
    constexpr uint8_t shard = 255;
    return {shard, docID, zoneID};
  }

  // The truncated text of a suffix; empty when its zone is absent, too short or unreadable
  // (`readable` is then false). Points into `zoneText`, which receives the text of the zone.
  [[nodiscard]] std::string_view fullText(const SuffixMeta& meta,
                                          const leveldb::ReadOptions& options,
                                          std::string* zoneText, bool* readable) const;
  // The truncated text of a suffix within the given zone text.
  [[nodiscard]] std::string_view suffixText(const SuffixMeta& meta,
                                            std::string_view zoneText) const;

  // Opens the posting list files beside the database after loading. They change the speed of
  // answers only.
  void openPostings() TL_EXCLUDES(_metricsMutex);

  [[nodiscard]] const std::string& path() const { return _database.path; }
  // See OrderedSyncEnv.
  [[nodiscard]] const std::string& crashNotes() const { return _database.env->crashNotes(); }
  [[nodiscard]] Activity& scans() const { return _merges.schedule().scans(); }
  // Its thread reads the index.
  [[nodiscard]] SuffixStarts& starts() const { return _starts; }

  // Waits until each zone that is being added can be read.
  void waitForZoneInHand() const { _zoneWriter.waitForZoneInHand(); }

  // State, for one moment.

  [[nodiscard]] MetricsBlock counters() const TL_EXCLUDES(_metricsMutex);
  [[nodiscard]] std::shared_ptr<const DocSet> deletedDocs() const TL_EXCLUDES(_metricsMutex);
  [[nodiscard]] std::shared_ptr<const ShardPostings> postings() const TL_EXCLUDES(_metricsMutex);
  [[nodiscard]] PostingsOwner postingsOwner(uint8_t shard) const TL_EXCLUDES(_metricsMutex);
  // Fills a view. Without `amidBatches` it waits for the batch in hand.
  void take(IndexView* view, size_t iteratorCount, bool amidBatches) const
      TL_EXCLUDES(_commitMutex, _metricsMutex);

  // Changes. A failed write is logged and leaves the state unchanged.

  // Writes the batch together with the metrics after change(metrics), and clears it.
  template <typename Change>
  [[nodiscard]] bool commit(leveldb::WriteBatch* batch, const Change& change)
      TL_EXCLUDES(_commitMutex, _metricsMutex) {
    platform::MutexLock lock(_commitMutex);
    return commitLocked(batch, false, change);
  }
  // Writes the metrics after change(metrics), if due(metrics). False if not, or on failure.
  template <typename Due, typename Change>
  [[nodiscard]] bool commitIf(const Due& due, const Change& change)
      TL_EXCLUDES(_commitMutex, _metricsMutex) {
    platform::MutexLock lock(_commitMutex);
    leveldb::WriteBatch batch;
    return due(counters()) && commitLocked(&batch, false, change);
  }
  // Commits one batch of a merge atomically, together with the resulting metrics, and clears it.
  // `pageDelta` is pages written minus pages removed.
  [[nodiscard]] bool commitMerge(leveldb::WriteBatch* batch, uint64_t hotMerged, int64_t pageDelta)
      TL_EXCLUDES(_commitMutex, _metricsMutex);
  // Writes the batch, which has the record of the deleted documents.
  [[nodiscard]] bool commitDeleted(leveldb::WriteBatch* batch, DocSet deleted)
      TL_EXCLUDES(_metricsMutex);
  // Changes the metrics in memory only.
  template <typename Change>
  void adjust(const Change& change) TL_EXCLUDES(_commitMutex, _metricsMutex) {
    platform::MutexLock commitLock(_commitMutex);
    platform::MutexLock lock(_metricsMutex);
    change(static_cast<MetricsBlock&>(metrics));
  }
  void countScan(std::chrono::nanoseconds time, const Scanner::Counts& counts) const
      TL_EXCLUDES(_metricsMutex);
  void setPostings(uint8_t shard, std::shared_ptr<const Postings> postings)
      TL_EXCLUDES(_metricsMutex);

  // Compacts the keys from `begin` to `end`; false when the disk has too little free space.
  bool compactRange(const leveldb::Slice* begin, const leveldb::Slice* end);
  [[nodiscard]] uint64_t compactionsEnded() const { return _compactionsEnded; }
  void removeObsoleteFilesLater() const;
  // Waits until what leveldb has written is on disk.
  void waitForDisk() { _database.env->waitForDisk(); }

 private:
  template <typename Change>
  [[nodiscard]] bool commitLocked(leveldb::WriteBatch* batch, bool movesSuffixes,
                                  const Change& change) TL_REQUIRES(_commitMutex)
      TL_EXCLUDES(_metricsMutex);
  [[nodiscard]] bool write(leveldb::WriteBatch* batch);
  // Restores everything except the scan counts.
  void restore(const MetricsBlock& before) TL_REQUIRES(_metricsMutex);
  void takeNow(IndexView* view, size_t iteratorCount) const TL_EXCLUDES(_metricsMutex);

  // Reads options, metrics and deleted documents. False, with an error, when the system fails to
  // read. A missing metrics record leaves the metrics unchanged.
  [[nodiscard]] bool readRecords(TLErrorOut error) TL_EXCLUDES(_metricsMutex);
  // False, with a log line, when the loaded counters are inconsistent.
  [[nodiscard]] bool metricsSound() const TL_EXCLUDES(_metricsMutex);

  friend Index* NewIndex(const Options& options, TLErrorOut error);

  Database _database;
  mutable BatchWriter _writer;

 public:
  // Fixed after construction.
  leveldb::DB* const db;
  Options op;

 private:
  mutable platform::Mutex _metricsMutex;
  mutable Metrics metrics TL_GUARDED_BY(_metricsMutex);
  // A batch that moves suffixes from the hot part into pages is being written.
  bool _suffixesMove TL_GUARDED_BY(_metricsMutex) = false;
  // Replaced as a whole by each deletion, so that a view keeps the set it was taken with. A
  // deletion writes the whole set anyway.
  std::shared_ptr<const DocSet> _deleted TL_GUARDED_BY(_metricsMutex) =
      std::make_shared<const DocSet>();
  // Replaced as a whole. The posting lists of a shard are dropped before its pages change.
  std::shared_ptr<const ShardPostings> _postings TL_GUARDED_BY(_metricsMutex) =
      std::make_shared<const ShardPostings>();
  // Incremented by every change to pages or to the documents visible in them: merge commits and
  // deletions.
  uint64_t _pageGeneration TL_GUARDED_BY(_metricsMutex) = 1;

  // Fair, so that the merge gets its turn between the writes of ingest.
  mutable platform::FairMutex _commitMutex TL_ACQUIRED_BEFORE(_metricsMutex);

  std::atomic<uint64_t> _compactionsEnded{0};  // on demand

  mutable ZoneWriter _zoneWriter{*this};
  Scanner _scanner{*this};
  mutable MergeScheduler _merges{*this};
  // Removes the files that long reads kept alive.
  mutable platform::SerialQueue _fileCleanup{"tallow-tidy", platform::QueuePriority::low};
  mutable SuffixStarts _starts;  // last, because its thread uses everything above
};

template <typename Change>
bool index::commitLocked(leveldb::WriteBatch* batch, bool movesSuffixes, const Change& change) {
  MetricsBlock before;
  {
    platform::MutexLock lock(_metricsMutex);
    before = metrics;
    change(static_cast<MetricsBlock&>(metrics));
    putMetrics(metrics, batch);
    if (movesSuffixes) ++_pageGeneration;
    _suffixesMove = movesSuffixes;
  }
  const bool written = write(batch);
  platform::MutexLock lock(_metricsMutex);
  _suffixesMove = false;
  if (!written) restore(before);
  return written;
}

}  // namespace salt
