#include <algorithm>
#include <cstring>
#include <system_error>
#include <thread>

#include "salt/IndexImpl.h"

// Writes to the index: adds zones to the hot part, and updates the set of deleted documents.
namespace salt {

namespace {

// A batch that has grown larger is freed instead of reused.
constexpr size_t kMaxKeptBatchBytes = 4 * 1024 * 1024;

double seconds(std::chrono::nanoseconds duration) {
  return static_cast<double>(duration.count()) / 1000000000;
}

bool holds(const std::vector<uint16_t>& zones, uint16_t zoneID) {
  return std::find(zones.begin(), zones.end(), zoneID) != zones.end();
}

bool refuse(const char* reason) {
  Log.error("{}", reason);
  return false;
}

}  // namespace

bool index::AddZone(uint32_t docID, uint16_t zoneID, std::string_view text,
                    std::vector<uint32_t>& offsets, bool merge) {
  const auto start = Clock::now();
  if (!zoneFits(docID, zoneID, text, offsets)) return false;
  const std::optional<Aftermath> aftermath = storeZone(start, docID, zoneID, text, offsets, merge);
  if (!aftermath) return false;
  if (aftermath->vacuumDue) vacuumAfterAdding();
  if (aftermath->delay.count() != 0) std::this_thread::sleep_for(aftermath->delay);
  return true;
}

// The zone is already stored when starting the merge fails; the next zone tries again.
void index::vacuumAfterAdding() {
  try {
    vacuum();
  } catch (const std::system_error& error) {
    Log.error("Error starting vacuum: {}", error.what());
  }
}

bool index::zoneFits(uint32_t docID, uint16_t zoneID, std::string_view text,
                     const std::vector<uint32_t>& offsets) const {
  if (docID == 0) return refuse("Invalid DocID.");
  if (zoneID == 0) return refuse("Invalid ZoneID.");
  if (text.size() > op.MaxZoneSize) return refuse("Zone text too large.");
  for (size_t i = 0; i < offsets.size(); ++i) {
    if (i > 0 && offsets[i] <= offsets[i - 1]) return refuse("Offsets out of order.");
    if (offsets[i] >= text.size()) return refuse("Token offset out of bounds.");
    if (text[offsets[i]] == '\0') return refuse("Empty token.");
  }
  return true;
}

std::optional<index::Aftermath> index::storeZone(Clock::time_point start, uint32_t docID,
                                                 uint16_t zoneID, std::string_view text,
                                                 std::vector<uint32_t>& offsets, bool merge) {
  platform::MutexLock lock(_writeMutex);
  const auto locked = Clock::now();
  if (deletedDocs()->contains(docID)) {
    refuse("Doc is deleted.");
    return std::nullopt;
  }
  const TextKey key = textKey(docID, zoneID);
  std::string stored;
  const Stored before = mayBeStored(docID, zoneID)
                            ? appendToStored(key, text, offsets, merge, &stored)
                            : Stored::none;
  if (before == Stored::failed) return std::nullopt;
  if (before == Stored::duplicate) return Aftermath{};
  putZone(key, docID, zoneID, before == Stored::appended ? stored : text, offsets);
  return commitZone(start, locked, docID, zoneID, offsets.size());
}

// Answers without a read where it can: no document above MaxDocID has text. Nearly all documents
// are new, and a look-up of theirs would miss in every level of the database.
bool index::mayBeStored(uint32_t docID, uint16_t zoneID) const {
  if (docID == _newestDoc) return holds(_newestZones, zoneID);
  platform::MutexLock lock(_metricsMutex);
  return docID <= metrics.MaxDocID;
}

// Puts a NUL between the old and the new text, so that no suffix runs across.
index::Stored index::appendToStored(const TextKey& key, std::string_view text,
                                    std::vector<uint32_t>& offsets, bool merge,
                                    std::string* stored) {
  const leveldb::Status status = db->Get(leveldb::ReadOptions(), slice(key.view()), stored);
  if (status.IsNotFound()) return Stored::none;
  if (!status.ok()) {
    Log.error("Error reading from db: {}", status.ToString());
    return Stored::failed;
  }
  if (!merge) {
    refuse("Zone already exists.");
    return Stored::failed;
  }
  if (*stored == text) {
    Log.debug("Ignoring duplicate text.");
    return Stored::duplicate;
  }
  stored->push_back('\0');
  for (uint32_t& offset : offsets) offset += static_cast<uint32_t>(stored->size());
  stored->append(text);
  if (stored->size() > op.MaxZoneSize) {
    refuse("Zone text too large.");
    return Stored::failed;
  }
  return Stored::appended;
}

void index::putZone(const TextKey& key, uint32_t docID, uint16_t zoneID, std::string_view text,
                    const std::vector<uint32_t>& offsets) {
  _batch->Put(slice(key.view()), slice(text));
  SuffixMeta meta;
  meta.DocID = docID;
  meta.ZoneID = zoneID;
  for (const uint32_t offset : offsets) {
    const std::string_view suffix = text.substr(offset);
    _starts.add(suffix);
    meta.Offset = offset;
    suffixKey(0, suffix.substr(0, suffixLength(suffix, op)), meta, &_key);
    _batch->Put(_key, {});
  }
}

std::optional<index::Aftermath> index::commitZone(Clock::time_point start, Clock::time_point locked,
                                                  uint32_t docID, uint16_t zoneID,
                                                  size_t suffixes) {
  const size_t batchBytes = _batch->ApproximateSize();
  uint32_t newestBefore = 0;
  Aftermath aftermath;
  bool written = false;
  {
    platform::MutexLock lock(_commitMutex);
    const auto now = Clock::now();
    written = commit(&*_batch, false, [&](MetricsBlock& counters) {
      newestBefore = counters.MaxDocID;
      counters.MaxDocID = std::max(counters.MaxDocID, docID);
      counters.LastDocID = docID;
      counters.Suffixes += suffixes;
      counters.HotSuffixes += suffixes;
      counters.IndexingCalls += 1;
      counters.IndexingSeconds += seconds(now - start);
      aftermath.delay = throttle(now - locked, counters);
      aftermath.vacuumDue = !counters.VacuumInProgress && counters.HotSuffixes > op.MaxHotSuffixes;
    });
  }
  if (batchBytes > kMaxKeptBatchBytes) _batch.emplace();
  if (!written) return std::nullopt;
  if (docID > newestBefore) {
    _newestDoc = docID;
    _newestZones.clear();
  }
  if (docID == _newestDoc && !holds(_newestZones, zoneID)) _newestZones.push_back(zoneID);
  return aftermath;
}

// No delay below twice MaxHotSuffixes; from there on whole multiples of the time that the write
// lock was held.
std::chrono::nanoseconds index::throttle(Clock::duration held, MetricsBlock& counters) const {
  const auto hot = static_cast<double>(counters.HotSuffixes);
  const double most = op.MaxHotSuffixes;
  if (!(hot > most * 1.1)) return std::chrono::nanoseconds(0);
  // A limit of 0 counts as 1.
  const auto times = static_cast<uint64_t>(hot / std::max(most, 1.0) - 1.0);
  const std::chrono::nanoseconds delay(static_cast<uint64_t>(held.count()) * times *
                                       op.ThrottleFactor);
  counters.ThrottlingSeconds += seconds(delay);
  return delay;
}

bool index::DeleteDocs(const std::vector<uint32_t>& docIDs) {
  platform::MutexLock lock(_writeMutex);
  const auto before = deletedDocs();
  DocSet after = *before;
  for (const uint32_t docID : docIDs) {
    if (docID == 0) return refuse("Invalid DocID.");
    if (!after.contains(docID)) after.insert(docID);
  }
  if (after.size() == before->size()) return true;
  std::string bytes;
  bytes.reserve(after.size() * sizeof(uint32_t));
  after.forEach(
      [&bytes](uint32_t id) { bytes.append(reinterpret_cast<const char*>(&id), sizeof id); });
  leveldb::WriteBatch batch;
  batch.Put(kDeletedKey, bytes);
  if (const leveldb::Status status = _writer.write(&batch); !status.ok()) {
    Log.error("Error writing to db: {}", status.ToString());
    return false;
  }
  platform::MutexLock metricsLock(_metricsMutex);
  _deleted = std::make_shared<const DocSet>(std::move(after));
  ++_pageGeneration;
  return true;
}

}  // namespace salt
