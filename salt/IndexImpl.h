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
#include "salt/Helper.h"
#include "salt/Index.h"
#include "salt/Postings.h"
#include "salt/ScanMemory.h"
#include "salt/Schedule.h"
#include "salt/SuffixStarts.h"

namespace salt {

class IndexView;
class PlaceSet;

// What a scan adds to the metrics.
struct ScanCounts {
  uint64_t results = 0;
  uint64_t fetches = 0;
  uint64_t hotReads = 0;
  uint64_t pageReads = 0;
};

inline constexpr char kDeletedKey[] =
    "\xFF"
    "DELETED";

// Puts the record of the metrics.
void putMetrics(const Index::MetricsBlock& metrics, leveldb::WriteBatch* batch);

// 0xFF is the first byte of texts and named keys.
inline constexpr uint8_t kMaxShardNumber = 0xFE;

// The index over a leveldb database. Three locks, taken in this order: the write mutex makes whole
// calls of AddZone and DeleteDoc follow one another; the commit mutex the writes of batches with
// metrics, which can wait long for leveldb; the metrics mutex, never held for long, guards the
// metrics and the taking of a view, so that no scan waits for a write.
//
// What holds at all times: the metrics in the database are those of the same batch as the keys that
// they count, and those in memory are changed under the commit mutex, but for the counts of scans.
// A reader's walk and its copy of the metrics are of the same moment, save those of a scan that
// begins while a batch is written: there the metrics may count what its walk does not see yet. What
// is deleted later stays visible to a reader.
class index final : public Index {
 public:
  explicit index(Database opened);
  // An index over a database that exists; null, with a log line, when there is none or it is not
  // sound; the error as of LoadIndex.
  [[nodiscard]] static std::unique_ptr<index> load(Database opened, TLErrorOut error = nullptr);
  // Waits for a merge that runs.
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
  void WaitWhileTidying() override;
  void Interrupt() override;
  [[nodiscard]] bool interrupted() const { return _schedule.interrupted(); }

  // Whether ScanPrefixes leaves out what it need not look for.
  [[nodiscard]] bool knowsStarts() const { return _starts.complete(); }

  // The text of Dump, in pieces of some 64 KiB. `sink` returns false to stop. False when it did,
  // or, with a log line, when reading failed.
  [[nodiscard]] bool dumpTo(const std::function<bool(std::string_view)>& sink) const;

  static TextKey textKey(uint32_t docID, uint16_t zoneID) {
    constexpr uint8_t shard = 255;
    return {shard, docID, zoneID};
  }

  // The cut text of a suffix, empty when its zone is not there, or cannot be read, which `readable`
  // tells, or is too short. It points into `zoneText`, which takes the text of the whole zone.
  [[nodiscard]] std::string_view fullText(const SuffixMeta& meta,
                                          const leveldb::ReadOptions& options,
                                          std::string* zoneText, bool* readable) const;
  // The same, of a zone's text at hand.
  [[nodiscard]] std::string_view suffixText(const SuffixMeta& meta,
                                            std::string_view zoneText) const;

  // One commit of a merge, whole or not at all: writes the batch, with the metrics that it leads
  // to, and clears it. `pageDelta` is pages written less pages removed. False when it failed, which
  // is logged.
  [[nodiscard]] bool commitMerge(leveldb::WriteBatch* batch, uint64_t hotMerged, int64_t pageDelta)
      TL_EXCLUDES(_commitMutex, _metricsMutex);

  [[nodiscard]] Activity& scans() const { return _schedule.scans(); }

  // Opens the postings that are beside the database, once it is loaded. Without them all answers
  // are the same.
  void openPostings() TL_EXCLUDES(_metricsMutex);

  // The directory of the database.
  [[nodiscard]] const std::string& path() const { return _database.path; }

  // See IndexFiles.
  [[nodiscard]] const std::string& crashNotes() const { return _database.files->crashNotes(); }

 private:
  using Clock = std::chrono::steady_clock;

  // What AddZone has left to do once the locks are released.
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
  // The delay that the counters ask for, which is counted.
  [[nodiscard]] std::chrono::nanoseconds throttle(Clock::duration held,
                                                  MetricsBlock& counters) const;

  [[nodiscard]] std::shared_ptr<const DocSet> deletedDocs() const TL_EXCLUDES(_metricsMutex);

  // Writes the batch together with the metrics as change(metrics) leaves them, and clears it. After
  // a failure, which is logged, the metrics are what they were. `movesSuffixes` tells of a batch
  // after which pages hold what they did not.
  template <typename Change>
  [[nodiscard]] bool commit(leveldb::WriteBatch* batch, bool movesSuffixes, const Change& change)
      TL_REQUIRES(_commitMutex) TL_EXCLUDES(_metricsMutex);
  [[nodiscard]] bool write(leveldb::WriteBatch* batch);
  // All but the counts of scans.
  void restore(const MetricsBlock& before) TL_REQUIRES(_metricsMutex);

  void vacuumAfterAdding();
  // The shard that the next merge goes into; a new one is counted.
  [[nodiscard]] uint8_t chooseShard(MetricsBlock& counters) const;
  // Marks a merge as running and chooses its shard; none when it is not worthwhile, one runs
  // already, or the mark cannot be written.
  [[nodiscard]] std::optional<uint8_t> beginVacuum() TL_EXCLUDES(_commitMutex, _metricsMutex);
  [[nodiscard]] bool vacuumIsDue() const TL_EXCLUDES(_metricsMutex);
  void startMerge(uint8_t shard) TL_EXCLUDES(_commitMutex);
  // On the merge thread.
  void runMerge(uint8_t shard) TL_EXCLUDES(_commitMutex, _metricsMutex);
  void mergeInto(uint8_t shard) TL_EXCLUDES(_commitMutex, _metricsMutex);
  // The merge itself, with the postings of its shard; false when it did not come to the end.
  // Without `hot` only the postings are made.
  [[nodiscard]] bool mergePages(uint8_t shard, bool hot) TL_EXCLUDES(_commitMutex, _metricsMutex);
  // Of an index that was merged without them, or whose files were damaged.
  void makeMissingPostings() TL_EXCLUDES(_commitMutex, _metricsMutex);
  void setPostings(uint8_t shard, std::shared_ptr<const Postings> postings)
      TL_EXCLUDES(_metricsMutex);
  [[nodiscard]] PostingsOwner postingsOwner(uint8_t shard) const TL_EXCLUDES(_metricsMutex);
  // Starts a merge if it is worthwhile and none runs.
  void vacuum();
  [[nodiscard]] uint64_t hotSuffixes() const TL_EXCLUDES(_metricsMutex);
  [[nodiscard]] uint64_t suffixesPerShard() const TL_EXCLUDES(_metricsMutex);
  void compactPart(uint8_t shard);
  // The keys from `begin` to `end`; false without room.
  bool compactRange(const leveldb::Slice* begin, const leveldb::Slice* end);
  void removeObsoleteFiles() const;

  // Reads options, metrics and the deleted documents; false, with an error, when the system does
  // not let it. Metrics that are not there stay as they are.
  [[nodiscard]] bool readRecords(TLErrorOut error) TL_EXCLUDES(_metricsMutex);
  // False, with a log line, when the loaded counters cannot be those of a sound index.
  [[nodiscard]] bool metricsSound() const TL_EXCLUDES(_metricsMutex);

  // Has SuffixStarts walk over what was there before it.
  void learnStarts() const;
  void remember(std::string_view prefix, const IndexView& view, const PlaceSet& pages) const;
  void countScan(Clock::time_point start, const ScanCounts& counts) const
      TL_EXCLUDES(_metricsMutex);
  void forEachZone(const IndexView& view,
                   const std::function<bool(uint32_t, uint16_t, std::string_view)>& callback) const;

  friend class IndexView;
  friend Index* NewIndex(const Options& options, TLErrorOut error);

  Database _database;
  mutable BatchWriter _writer;

 public:
  // Fixed from the construction on.
  leveldb::DB* const db;
  Options op;

 private:
  mutable platform::Mutex _metricsMutex;
  mutable Metrics metrics TL_GUARDED_BY(_metricsMutex);
  // A batch is being written that moves suffixes from the hot part into pages.
  bool _suffixesMove TL_GUARDED_BY(_metricsMutex) = false;

  // Fair, so that a merge, which comes more seldom, gets its turn.
  mutable platform::FairMutex _commitMutex TL_ACQUIRED_BEFORE(_metricsMutex);

  platform::Mutex _writeMutex TL_ACQUIRED_BEFORE(_commitMutex);
  // Kept for their memory.
  std::optional<leveldb::WriteBatch> _batch TL_GUARDED_BY(_writeMutex);
  std::string _key TL_GUARDED_BY(_writeMutex);
  // The zones of the document that was above all others when it came, 0 for none.
  uint32_t _newestDoc TL_GUARDED_BY(_writeMutex) = 0;
  std::vector<uint16_t> _newestZones TL_GUARDED_BY(_writeMutex);

  // Replaced as a whole by each deletion, under both mutexes, so that a view keeps the set of its
  // moment. A deletion writes the whole set anyway.
  std::shared_ptr<const DocSet> _deleted TL_GUARDED_BY(_metricsMutex);

  // By shard, null where there are none; replaced as a whole. Those of a shard are taken away
  // before its pages change.
  using ShardPostings = std::vector<std::shared_ptr<const Postings>>;
  std::shared_ptr<const ShardPostings> _postings TL_GUARDED_BY(_metricsMutex) =
      std::make_shared<const ShardPostings>();

  // Counts what changes the pages or hides documents in them: commits of merges and deletions.
  uint64_t _pageGeneration TL_GUARDED_BY(_metricsMutex) = 1;
  mutable ScanMemory _scanMemory;  // synchronised by itself, as are the next
  mutable Helper _scanHelper;
  mutable Schedule _schedule;

  std::atomic<uint64_t> _compactionsEnded{0};  // of those on demand

  mutable SuffixStarts _starts;  // synchronised by itself; its thread reads the index
  // Removes files behind long walks; last, since it uses all the rest.
  mutable platform::SerialQueue _tidying{"tallow-tidy", platform::QueuePriority::low};
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

// What every reader works from: one walk over the database or several, the metrics and the set of
// deleted documents, all of the same moment. One thread, save that each walk may be another's; the
// index outlives it.
//
// The iterator holds the keys of its moment by itself. A leveldb snapshot would, too, but while one
// lives, a compaction keeps a removed key together with the mark that removes it, and may put the
// two into neighbouring files of a level; a later compaction of the first file alone then drops the
// mark (leveldb 1.23 looks for such neighbours in the upper level only), and the removed key is
// back. Single reads go to the newest state: a stored text only ever grows behind a NUL, so that a
// suffix reads the same.
class IndexView {
 public:
  // For scans, which fill the block cache: there are `walks` iterators, for as many threads, or one
  // while suffixes move, since another could be of the moment behind the batch.
  // With `fillCache` false the reads do not displace the block cache, and the view is of a moment
  // between batches, for which it waits.
  IndexView(const index& owner, bool fillCache, size_t walks = 1);
  // Files that only a long walk has kept go with it.
  ~IndexView();
  IndexView(const IndexView&) = delete;
  IndexView& operator=(const IndexView&) = delete;

  // The last shard number to visit; the hot part is 0.
  [[nodiscard]] uint8_t lastShard() const;

  const index& idx;
  leveldb::ReadOptions options;
  std::vector<std::unique_ptr<leveldb::Iterator>> iterators;  // none is null
  Index::Metrics metrics;
  std::shared_ptr<const DocSet> deleted;
  std::shared_ptr<const std::vector<std::shared_ptr<const Postings>>> postings;  // by shard
  uint64_t pageGeneration = 0;  // 0 where it cannot be told

 private:
  void take(size_t walks);

  uint64_t _compactionsEnded;  // before; scans do not ask
  const platform::CrashNote _note;
};

}  // namespace salt
