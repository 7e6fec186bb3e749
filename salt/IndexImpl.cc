#include "salt/IndexImpl.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <ctime>
#include <sstream>
#include <system_error>
#include <thread>

#include "platform/Assert.h"

namespace salt {

namespace {

constexpr char kOptionsKey[] = "\xFFOPTIONS";
constexpr char kMetricsKey[] = "\xFFMETRICS";

template <typename Record>
leveldb::Status putRecord(leveldb::DB* db, const char* key, const Record& record) {
  std::ostringstream bytes;
  TL_ASSERT(record.SerializeToOstream(bytes));
  return db->Put(leveldb::WriteOptions(), key, bytes.str());
}

template <typename Record>
bool parseRecord(const std::string& bytes, Record* record) {
  std::istringstream stream(bytes);
  return record->ParseFromIstream(stream);
}

}  // namespace

index::index(Database opened)
    : _database(std::move(opened)), _writer(_database), db(_database.db.get()) {}

// Damaged records end the process; failures of the system to read them do not.
bool index::readRecords(TLErrorOut error) {
  const auto read = [this, error](const char* key, std::string* bytes) {
    leveldb::Status status = db->Get(leveldb::ReadOptions(), key, bytes);
    if (const auto failure = systemError(status)) platform::setError(error, *failure);
    return status;
  };
  std::string bytes;
  platform::MutexLock lock(_metricsMutex);
  leveldb::Status status = read(kMetricsKey, &bytes);
  if (status.IsIOError()) return false;
  if (!status.ok() || !parseRecord(bytes, &metrics)) return true;
  if (metrics.CodeVersion != CODE_VERSION) return true;
  status = read(kOptionsKey, &bytes);
  if (status.IsIOError()) return false;
  TL_ASSERT(status.ok());
  TL_ASSERT(parseRecord(bytes, &op));
  TL_ASSERT(op.Valid());
  status = read(kDeletedKey, &bytes);
  if (status.IsNotFound()) return true;
  if (status.IsIOError()) return false;
  TL_ASSERT(status.ok());
  DocSet deleted;
  for (size_t at = 0; at + sizeof(uint32_t) <= bytes.size(); at += sizeof(uint32_t)) {
    uint32_t docID = 0;
    std::memcpy(&docID, bytes.data() + at, sizeof docID);
    if (docID != 0) deleted.insert(docID);
  }
  _deleted = std::make_shared<const DocSet>(std::move(deleted));
  return true;
}

Index* NewIndex(const Index::Options& options, TLErrorOut error) {
  Database database = openDatabase(options.Path, OpenMode::create);
  leveldb::Status status = database.status;
  if (status.ok()) status = putRecord(database.db.get(), kOptionsKey, options);
  Index::Metrics metrics;
  metrics.CodeVersion = CODE_VERSION;
  metrics.CreationTime = std::time(nullptr);
  if (status.ok()) status = putRecord(database.db.get(), kMetricsKey, metrics);
  if (!status.ok()) {
    platform::setError(error,
                       systemError(status).value_or(platform::posixError(EIO, status.ToString())));
    return nullptr;
  }
  auto idx = std::make_unique<index>(std::move(database));
  if (!idx->readRecords(error)) return nullptr;
  platform::MutexLock lock(idx->_metricsMutex);
  TL_ASSERT(idx->metrics.CodeVersion == CODE_VERSION);
  return idx.release();
}

Index* NewIndex(const Index::Options& options) {
  Index* const made = NewIndex(options, nullptr);
  TL_ASSERT(made);
  return made;
}

Index* LoadIndex(const std::string& path, TLErrorOut error) {
  auto loaded = index::load(openDatabase(path, OpenMode::existing), error);
  if (loaded != nullptr) loaded->openPostings();
  return loaded.release();
}

std::unique_ptr<index> index::load(Database opened, TLErrorOut error) {
  if (!opened.db) {
    if (const auto failure = systemError(opened.status)) platform::setError(error, *failure);
    return nullptr;
  }
  const platform::CrashNote note(opened.env->crashNotes());
  auto idx = std::make_unique<index>(std::move(opened));
  if (!idx->readRecords(error)) {
    Log.error("Loading failure: The database cannot be read.");
    return nullptr;
  }
  if (!idx->metricsSound()) return nullptr;
  if (idx->op.ValidateOnLoad && !idx->Validate()) {
    Log.fault("Loading failure: Validation failed.");
    return nullptr;
  }
  platform::MutexLock lock(idx->_metricsMutex);
  idx->metrics.VacuumInProgress = false;
  return idx;
}

PostingsOwner index::postingsOwner(uint8_t shard) const {
  platform::MutexLock lock(_metricsMutex);
  return {metrics.CreationTime, shard};
}

void index::setPostings(uint8_t shard, std::shared_ptr<const Postings> postings) {
  platform::MutexLock lock(_metricsMutex);
  ShardPostings changed = *_postings;
  if (shard >= changed.size()) changed.resize(shard + size_t{1});
  changed[shard] = std::move(postings);
  _postings = std::make_shared<const ShardPostings>(std::move(changed));
}

void index::openPostings() {
  uint64_t shards = 0;
  {
    platform::MutexLock lock(_metricsMutex);
    shards = std::min<uint64_t>(metrics.Shards, kMaxShardNumber);
  }
  for (uint8_t shard = 1; shard <= shards; ++shard) {
    if (auto postings = Postings::open(_database.path, postingsOwner(shard))) {
      setPostings(shard, std::move(postings));
    }
  }
}

bool index::metricsSound() const {
  platform::MutexLock lock(_metricsMutex);
  if (metrics.CodeVersion != CODE_VERSION) {
    Log.error("Loading failure: Mismatched code version.");
    return false;
  }
  const auto product = [](uint64_t count, uint32_t each) {
    return static_cast<double>(count) * static_cast<double>(each);
  };
  if (metrics.Shards > op.MaxShards ||
      product(metrics.Zones, op.MaxZoneSize) < static_cast<double>(metrics.TextBytes) ||
      metrics.Suffixes < metrics.HotSuffixes ||
      product(metrics.Pages, op.MaxPageSuffixes) <
          static_cast<double>(metrics.Suffixes - metrics.HotSuffixes)) {
    Log.fault("Loading failure: Metrics corrupted.");
    return false;
  }
  return true;
}

std::string_view index::fullText(const SuffixMeta& meta, const leveldb::ReadOptions& options,
                                 std::string* zoneText, bool* readable) const {
  const leveldb::Status status =
      db->Get(options, slice(textKey(meta.DocID, meta.ZoneID).view()), zoneText);
  *readable = status.ok() || status.IsNotFound();
  if (!*readable) Log.error("Error reading from db: {}", status.ToString());
  return status.ok() ? suffixText(meta, *zoneText) : "";
}

std::string_view index::suffixText(const SuffixMeta& meta, std::string_view zoneText) const {
  if (zoneText.size() < meta.Offset) return "";
  const std::string_view text = zoneText.substr(meta.Offset);
  return text.substr(0, suffixLength(text, op));
}

std::string index::GetSuffixText(const SuffixMeta& meta) const {
  std::string zoneText;
  bool readable = true;
  return std::string(fullText(meta, leveldb::ReadOptions(), &zoneText, &readable));
}

Index::MetricsBlock index::counters() const {
  platform::MutexLock lock(_metricsMutex);
  return metrics;
}

std::shared_ptr<const DocSet> index::deletedDocs() const {
  platform::MutexLock lock(_metricsMutex);
  return _deleted;
}

std::shared_ptr<const ShardPostings> index::postings() const {
  platform::MutexLock lock(_metricsMutex);
  return _postings;
}

bool index::AddZone(uint32_t docID, uint16_t zoneID, std::string_view text,
                    std::vector<uint32_t>& offsets, bool merge) {
  const auto aftermath = _zoneWriter.addZone(docID, zoneID, text, offsets, merge);
  if (!aftermath) return false;
  try {
    if (aftermath->vacuumDue) _merges.mergeIfDue();
  } catch (const std::system_error& error) {
    // The zone is stored; the next one tries again.
    Log.error("Error starting vacuum: {}", error.what());
  }
  if (aftermath->delay.count() != 0) std::this_thread::sleep_for(aftermath->delay);
  return true;
}

bool index::Sync() {
  const leveldb::Status status = _writer.sync();
  if (!status.ok()) Log.error("Error syncing db: {}", status.ToString());
  return status.ok();
}

bool index::compactRange(const leveldb::Slice* begin, const leveldb::Slice* end) {
  if (!_writer.compact(begin, end)) return false;
  ++_compactionsEnded;
  return true;
}

// Not on the calling thread: it takes as long as a memtable flush, and waits for a running
// compaction.
void index::removeObsoleteFilesLater() const {
  (void)_fileCleanup.async([this] {
    if (!interrupted()) (void)_writer.flush();
  });
}

Index::Metrics index::GetMetrics() const {
  const IndexView view(*this, false);
  Metrics result = view.metrics;
  result.Docs = result.Zones = result.TextBytes = 0;
  result.DeletedDocs = view.deleted->size();
  uint32_t previous = 0;
  view.forEachZone([&](uint32_t docID, uint16_t zoneID, std::string_view text) {
    if (docID != previous) ++result.Docs;
    previous = docID;
    ++result.ZoneCounts[zoneID];
    ++result.Zones;
    result.TextBytes += text.size();
    return true;
  });
  return result;
}

void index::ResetScanMetrics() {
  platform::MutexLock lock(_metricsMutex);
  metrics.Scans = 0;
  metrics.ScanSeconds = 0;
  metrics.ScanResults = 0;
  metrics.ScanTextFetches = 0;
  metrics.ScanHotReads = 0;
  metrics.ScanPageReads = 0;
}

void putMetrics(const Index::MetricsBlock& metrics, leveldb::WriteBatch* batch) {
  batch->Put(kMetricsKey, {reinterpret_cast<const char*>(&metrics), sizeof metrics});
}

bool index::commitMerge(leveldb::WriteBatch* batch, uint64_t hotMerged, int64_t pageDelta) {
  platform::MutexLock lock(_commitMutex);
  return commitLocked(batch, true, [&](MetricsBlock& counters) {
    if (counters.LastShardVacuumed == counters.Shards) counters.LastShardSuffixes += hotMerged;
    counters.HotSuffixes -= std::min(hotMerged, counters.HotSuffixes);
    counters.Pages += static_cast<uint64_t>(pageDelta);
  });
}

bool index::commitDeleted(leveldb::WriteBatch* batch, DocSet deleted) {
  if (!write(batch)) return false;
  platform::MutexLock lock(_metricsMutex);
  _deleted = std::make_shared<const DocSet>(std::move(deleted));
  ++_pageGeneration;
  return true;
}

void index::countScan(std::chrono::nanoseconds time, const Scanner::Counts& counts) const {
  platform::MutexLock lock(_metricsMutex);
  metrics.Scans += 1;
  metrics.ScanSeconds += static_cast<double>(time.count()) / 1000000000;
  metrics.ScanResults += counts.results;
  metrics.ScanTextFetches += counts.fetches;
  metrics.ScanHotReads += counts.hotReads;
  metrics.ScanPageReads += counts.pageReads;
}

bool index::write(leveldb::WriteBatch* batch) {
  const leveldb::Status status = _writer.write(batch);
  batch->Clear();
  if (!status.ok()) Log.error("Error writing to db: {}", status.ToString());
  return status.ok();
}

void index::restore(const MetricsBlock& before) {
  MetricsBlock block = before;
  block.Scans = metrics.Scans;
  block.ScanSeconds = metrics.ScanSeconds;
  block.ScanResults = metrics.ScanResults;
  block.ScanTextFetches = metrics.ScanTextFetches;
  block.ScanHotReads = metrics.ScanHotReads;
  block.ScanPageReads = metrics.ScanPageReads;
  static_cast<MetricsBlock&>(metrics) = block;
}

void index::take(IndexView* view, size_t iteratorCount, bool amidBatches) const {
  if (amidBatches) return takeNow(view, iteratorCount);
  platform::MutexLock lock(_commitMutex);
  takeNow(view, iteratorCount);
}

void index::takeNow(IndexView* view, size_t iteratorCount) const {
  platform::MutexLock lock(_metricsMutex);
  view->iterators.resize(_suffixesMove ? 1 : iteratorCount);
  for (auto& iterator : view->iterators) iterator.reset(db->NewIterator(view->options));
  view->metrics = metrics;
  view->deleted = _deleted;
  view->postings = _postings;
  view->pageGeneration = _suffixesMove ? 0 : _pageGeneration;
}

}  // namespace salt
