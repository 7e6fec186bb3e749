#pragma once

#include <leveldb/db.h>
#include <leveldb/write_batch.h>

#include <atomic>
#include <chrono>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/CrashNote.h"
#include "platform/Mutex.h"
#include "platform/Queue.h"
#include "salt/Coding.h"
#include "salt/Database.h"
#include "salt/DocSet.h"
#include "salt/Index.h"
#include "salt/Postings.h"
#include "salt/ScanCache.h"
#include "salt/Schedule.h"
#include "salt/SuffixStarts.h"
#include "salt/TwoThreadRunner.h"

namespace salt {

class IndexView;
class PostingSet;

// The counts that one scan adds to the metrics.
struct ScanCounts {
  uint64_t results = 0;
  uint64_t fetches = 0;
  uint64_t hotReads = 0;
  uint64_t pageReads = 0;
};

inline constexpr char kDeletedKey[] =
    "\xFF"
    "DELETED";

// Adds the metrics record to the batch.
void putMetrics(const Index::MetricsBlock& metrics, leveldb::WriteBatch* batch);

// 0xFF is the first byte of stored texts and named keys.
inline constexpr uint8_t kMaxShardNumber = 0xFE;

// The index over a leveldb database.
//
// Threads. Three locks, taken in this order: the write mutex serialises AddZone and DeleteDocs; the
// commit mutex serialises the writes of batches with metrics, which may wait a long time for
// leveldb; the metrics mutex, held only briefly, guards the metrics and the creation of a view, so
// that no scan waits for a write.
//
// Invariants. The stored metrics always belong to the same batch as the keys they count. Metrics in
// memory change under the commit mutex, except for the scan counts. A view's iterators and its copy
// of the metrics are of the same moment, unless the view is taken during a write: then the metrics
// may already count what the iterators do not see yet. A view does not see later deletions.
class index final : public Index {
 public:
  explicit index(Database opened);
  // Opens the index in an existing database; null, with a log line, when there is none or it is
  // unsound; sets the error as LoadIndex does.
  [[nodiscard]] static std::unique_ptr<index> load(Database opened, TLErrorOut error = nullptr);
  // Waits for the running merge.
  ~index() override;

  [[nodiscard]] const Options& GetOptions() const override { return op; }
  [[nodiscard]] std::string GetSuffixText(const SuffixMeta& meta) const override;
  bool AddZone(uint32_t docID, uint16_t zoneID, std::string_view text,
               std::vector<uint32_t>& offsets, bool merge) override;
  bool DeleteDoc(uint32_t docID) override { return DeleteDocs({docID}); }
  bool DeleteDocs(const std::vector<uint32_t>& docIDs) override;
  bool ScanPrefix(std::string_view prefix,
                  std::function<bool(const SuffixMeta&)> callback) const override;
  void ForEachZone(std::function<bool(uint32_t docID, uint16_t zoneID, std::string_view text)>
                       callback) const override;
  void Vacuum() override;
  bool Sync() override;
  bool Compact() override;
  [[nodiscard]] Metrics GetMetrics() const override;
  void ResetScanMetrics() override;
  [[nodiscard]] bool Validate() const override;
  [[nodiscard]] std::string Dump() const override;
  std::optional<uint64_t> ScanPlaces(std::string_view prefix, uint64_t limit,
                                     const PlacesCallback& callback) const override;
  [[nodiscard]] std::vector<std::vector<SuffixMeta>> ScanPrefixes(
      const std::vector<std::string>& prefixes, size_t limit) const override;
  void WaitForMaintenance() override;
  void Interrupt() override;
  [[nodiscard]] bool interrupted() const { return _schedule.interrupted(); }

  // Whether the Bloom filter of ScanPrefixes is complete.
  [[nodiscard]] bool knowsStarts() const { return _starts.complete(); }

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

  // Commits one batch of a merge atomically, together with the resulting metrics, and clears it.
  // `pageDelta` is pages written minus pages removed. False, with a log line, on failure.
  [[nodiscard]] bool commitMerge(leveldb::WriteBatch* batch, uint64_t hotMerged, int64_t pageDelta)
      TL_EXCLUDES(_commitMutex, _metricsMutex);

  [[nodiscard]] Activity& scans() const { return _schedule.scans(); }

  // Opens the posting list files beside the database after loading. They change the speed of
  // answers only.
  void openPostings() TL_EXCLUDES(_metricsMutex);

  [[nodiscard]] const std::string& path() const { return _database.path; }

  // See OrderedSyncEnv.
  [[nodiscard]] const std::string& crashNotes() const { return _database.env->crashNotes(); }

 private:
  using Clock = std::chrono::steady_clock;

  // What AddZone still has to do after it has released the locks.
  struct Aftermath {
    bool vacuumDue = false;
    std::chrono::nanoseconds delay{0};
  };

  [[nodiscard]] bool zoneFits(uint32_t docID, uint16_t zoneID, std::string_view text,
                              const std::vector<uint32_t>& offsets) const;
  [[nodiscard]] std::optional<Aftermath> storeZone(Clock::time_point start, uint32_t docID,
                                                   uint16_t zoneID, std::string_view text,
                                                   std::vector<uint32_t>& offsets, bool merge);
  enum class Stored { none, duplicate, appended, failed };
  [[nodiscard]] Stored appendToStored(const TextKey& key, std::string_view text,
                                      std::vector<uint32_t>& offsets, bool merge,
                                      std::string* stored) TL_REQUIRES(_writeMutex);
  [[nodiscard]] bool mayBeStored(uint32_t docID, uint16_t zoneID) const TL_REQUIRES(_writeMutex)
      TL_EXCLUDES(_metricsMutex);
  void putZone(const TextKey& key, uint32_t docID, uint16_t zoneID, std::string_view text,
               const std::vector<uint32_t>& offsets) TL_REQUIRES(_writeMutex);
  [[nodiscard]] std::optional<Aftermath> commitZone(Clock::time_point start,
                                                    Clock::time_point locked, uint32_t docID,
                                                    uint16_t zoneID, size_t suffixes)
      TL_REQUIRES(_writeMutex) TL_EXCLUDES(_commitMutex);
  // The throttling delay, which is also added to the counters.
  [[nodiscard]] std::chrono::nanoseconds throttle(Clock::duration held,
                                                  MetricsBlock& counters) const;

  [[nodiscard]] std::shared_ptr<const DocSet> deletedDocs() const TL_EXCLUDES(_metricsMutex);

  // Writes the batch together with the metrics after change(metrics), and clears it. A failure is
  // logged and leaves the metrics unchanged. `movesSuffixes` marks a batch that changes pages.
  template <typename Change>
  [[nodiscard]] bool commit(leveldb::WriteBatch* batch, bool movesSuffixes, const Change& change)
      TL_REQUIRES(_commitMutex) TL_EXCLUDES(_metricsMutex);
  [[nodiscard]] bool write(leveldb::WriteBatch* batch);
  // Restores everything except the scan counts.
  void restore(const MetricsBlock& before) TL_REQUIRES(_metricsMutex);

  void vacuumAfterAdding();
  // Chooses the shard of the next merge; counts it if it is new.
  [[nodiscard]] uint8_t chooseShard(MetricsBlock& counters) const;
  // Records a merge as running and chooses its shard; nullopt when a merge is not due, is already
  // running, or cannot be recorded.
  [[nodiscard]] std::optional<uint8_t> beginVacuum() TL_EXCLUDES(_commitMutex, _metricsMutex);
  [[nodiscard]] bool vacuumIsDue() const TL_EXCLUDES(_metricsMutex);
  void startMerge(uint8_t shard) TL_EXCLUDES(_commitMutex);
  // Runs on the merge thread.
  void runMerge(uint8_t shard) TL_EXCLUDES(_commitMutex, _metricsMutex);
  void mergeInto(uint8_t shard) TL_EXCLUDES(_commitMutex, _metricsMutex);
  // Merges the hot part into the shard and rebuilds the shard's posting lists; false when it did
  // not finish. Without `hot` it only builds the posting lists.
  [[nodiscard]] bool mergePages(uint8_t shard, bool hot) TL_EXCLUDES(_commitMutex, _metricsMutex);
  // Builds posting lists for the shards that have none: never built, or removed as damaged.
  void makeMissingPostings() TL_EXCLUDES(_commitMutex, _metricsMutex);
  void setPostings(uint8_t shard, std::shared_ptr<const Postings> postings)
      TL_EXCLUDES(_metricsMutex);
  [[nodiscard]] PostingsOwner postingsOwner(uint8_t shard) const TL_EXCLUDES(_metricsMutex);
  // Starts a merge if one is due and none is running.
  void vacuum();
  [[nodiscard]] uint64_t hotSuffixes() const TL_EXCLUDES(_metricsMutex);
  [[nodiscard]] uint64_t suffixesPerShard() const TL_EXCLUDES(_metricsMutex);
  void compactPart(uint8_t shard);
  // Compacts the keys from `begin` to `end`; false when the disk has too little free space.
  bool compactRange(const leveldb::Slice* begin, const leveldb::Slice* end);
  void removeObsoleteFiles() const;

  // Reads options, metrics and deleted documents. False, with an error, when the system fails to
  // read. A missing metrics record leaves the metrics unchanged.
  [[nodiscard]] bool readRecords(TLErrorOut error) TL_EXCLUDES(_metricsMutex);
  // False, with a log line, when the loaded counters are inconsistent.
  [[nodiscard]] bool metricsSound() const TL_EXCLUDES(_metricsMutex);

  // Starts the build of the Bloom filter from the stored texts.
  void learnStarts() const;
  void remember(std::string_view prefix, const IndexView& view, const PostingSet& pages) const;
  void countScan(Clock::time_point start, const ScanCounts& counts) const
      TL_EXCLUDES(_metricsMutex);
  void forEachZone(const IndexView& view,
                   const std::function<bool(uint32_t, uint16_t, std::string_view)>& callback) const;

  friend class IndexView;
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

  // Fair, so that the merge gets its turn between the writes of ingest.
  mutable platform::FairMutex _commitMutex TL_ACQUIRED_BEFORE(_metricsMutex);

  platform::Mutex _writeMutex TL_ACQUIRED_BEFORE(_commitMutex);
  // Reused to avoid allocation.
  std::optional<leveldb::WriteBatch> _batch TL_GUARDED_BY(_writeMutex);
  std::string _key TL_GUARDED_BY(_writeMutex);
  // The newest document and its zones; 0 before the first. Tells without a read what is stored.
  uint32_t _newestDoc TL_GUARDED_BY(_writeMutex) = 0;
  std::vector<uint16_t> _newestZones TL_GUARDED_BY(_writeMutex);

  // Replaced as a whole by each deletion, under both mutexes, so that a view keeps the set it was
  // taken with. A deletion writes the whole set anyway.
  std::shared_ptr<const DocSet> _deleted TL_GUARDED_BY(_metricsMutex);

  // By shard, null where there are none; replaced as a whole. The posting lists of a shard are
  // dropped before its pages change.
  using ShardPostings = std::vector<std::shared_ptr<const Postings>>;
  std::shared_ptr<const ShardPostings> _postings TL_GUARDED_BY(_metricsMutex) =
      std::make_shared<const ShardPostings>();

  // Incremented by every change to pages or to the documents visible in them: merge commits and
  // deletions.
  uint64_t _pageGeneration TL_GUARDED_BY(_metricsMutex) = 1;
  mutable ScanCache _scanCache;  // thread-safe, as are the next two
  mutable TwoThreadRunner _scanRunner;
  mutable Schedule _schedule;

  std::atomic<uint64_t> _compactionsEnded{0};  // on demand

  mutable SuffixStarts _starts;  // thread-safe; its thread reads the index
  // Removes the files that long reads kept alive; last, because it uses everything above.
  mutable platform::SerialQueue _fileCleanup{"tallow-tidy", platform::QueuePriority::low};
};

template <typename Change>
bool index::commit(leveldb::WriteBatch* batch, bool movesSuffixes, const Change& change) {
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

// The snapshot that every reader works on: one or more iterators, the metrics and the set of
// deleted documents, all of the same moment. Used by one thread, except that each iterator may be
// used by another. The index outlives it.
//
// The iterator alone holds the keys of its moment. A leveldb snapshot would do so too, but while a
// snapshot exists, a compaction keeps a removed key together with its tombstone and may split the
// two into neighbouring files of a level. A later compaction of the first file alone then drops the
// tombstone (leveldb 1.23 looks for such neighbours in the upper level only), and the removed key
// comes back. Single reads use the newest state; this is safe because a stored text only grows,
// after a NUL, so every suffix reads the same.
class IndexView {
 public:
  // Scans fill the block cache and may have several iterators, one per thread. There is only one
  // while suffixes move, because a second could be created after the batch and see another state.
  // With `fillCache` false the reads bypass the block cache, and the constructor waits for a moment
  // between batches.
  IndexView(const index& owner, bool fillCache, size_t iteratorCount = 1);
  // Schedules the removal of files that only this view kept alive.
  ~IndexView();
  IndexView(const IndexView&) = delete;
  IndexView& operator=(const IndexView&) = delete;

  // The last shard to visit; the hot part is shard 0.
  [[nodiscard]] uint8_t lastShard() const;

  const index& idx;
  leveldb::ReadOptions options;
  std::vector<std::unique_ptr<leveldb::Iterator>> iterators;  // none is null
  Index::Metrics metrics;
  std::shared_ptr<const DocSet> deleted;
  std::shared_ptr<const std::vector<std::shared_ptr<const Postings>>> postings;  // by shard
  uint64_t pageGeneration = 0;                                                   // 0 when unknown

 private:
  void take(size_t iteratorCount);

  uint64_t _compactionsEnded;  // when the view was taken; unused by scans
  const platform::CrashNote _note;
};

}  // namespace salt
