#include "salt/ZoneWriter.h"

#include <algorithm>

#include "salt/IndexImpl.h"

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

// The delay of AddZone, which is also added to the counters. No delay below twice MaxHotSuffixes;
// from there on whole multiples of the time that the write lock was held.
std::chrono::nanoseconds throttle(const Index::OptionsBlock& op,
                                  std::chrono::steady_clock::duration held,
                                  Index::MetricsBlock& counters) {
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

}  // namespace

bool ZoneWriter::zoneFits(uint32_t docID, uint16_t zoneID, std::string_view text,
                          const std::vector<uint32_t>& offsets) const {
  if (docID == 0) return refuse("Invalid DocID.");
  if (zoneID == 0) return refuse("Invalid ZoneID.");
  if (text.size() > _idx.op.MaxZoneSize) return refuse("Zone text too large.");
  for (size_t i = 0; i < offsets.size(); ++i) {
    if (i > 0 && offsets[i] <= offsets[i - 1]) return refuse("Offsets out of order.");
    if (offsets[i] >= text.size()) return refuse("Token offset out of bounds.");
    if (text[offsets[i]] == '\0') return refuse("Empty token.");
  }
  return true;
}

std::optional<ZoneWriter::Aftermath> ZoneWriter::addZone(uint32_t docID, uint16_t zoneID,
                                                         std::string_view text,
                                                         std::vector<uint32_t>& offsets,
                                                         bool merge) {
  const auto start = Clock::now();
  if (!zoneFits(docID, zoneID, text, offsets)) return std::nullopt;
  platform::MutexLock lock(_writeMutex);
  const auto locked = Clock::now();
  if (_idx.deletedDocs()->contains(docID)) {
    refuse("Doc is deleted.");
    return std::nullopt;
  }
  const TextKey key = index::textKey(docID, zoneID);
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
bool ZoneWriter::mayBeStored(uint32_t docID, uint16_t zoneID) const {
  if (docID == _newestDoc) return holds(_newestZones, zoneID);
  return docID <= _idx.counters().MaxDocID;
}

// Puts a NUL between the old and the new text, so that no suffix runs across.
ZoneWriter::Stored ZoneWriter::appendToStored(const TextKey& key, std::string_view text,
                                              std::vector<uint32_t>& offsets, bool merge,
                                              std::string* stored) {
  const leveldb::Status status = _idx.db->Get(leveldb::ReadOptions(), slice(key.view()), stored);
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
  if (stored->size() > _idx.op.MaxZoneSize) {
    refuse("Zone text too large.");
    return Stored::failed;
  }
  return Stored::appended;
}

void ZoneWriter::putZone(const TextKey& key, uint32_t docID, uint16_t zoneID, std::string_view text,
                         const std::vector<uint32_t>& offsets) {
  _batch->Put(slice(key.view()), slice(text));
  SuffixMeta meta;
  meta.DocID = docID;
  meta.ZoneID = zoneID;
  for (const uint32_t offset : offsets) {
    const std::string_view suffix = text.substr(offset);
    _idx.starts().add(suffix);
    meta.Offset = offset;
    suffixKey(0, suffix.substr(0, suffixLength(suffix, _idx.op)), meta, &_key);
    _batch->Put(_key, {});
  }
}

std::optional<ZoneWriter::Aftermath> ZoneWriter::commitZone(Clock::time_point start,
                                                            Clock::time_point locked,
                                                            uint32_t docID, uint16_t zoneID,
                                                            size_t suffixes) {
  const size_t batchBytes = _batch->ApproximateSize();
  uint32_t newestBefore = 0;
  Aftermath aftermath;
  const bool written = _idx.commit(&*_batch, [&](Index::MetricsBlock& counters) {
    const auto now = Clock::now();
    newestBefore = counters.MaxDocID;
    counters.MaxDocID = std::max(counters.MaxDocID, docID);
    counters.LastDocID = docID;
    counters.Suffixes += suffixes;
    counters.HotSuffixes += suffixes;
    counters.IndexingCalls += 1;
    counters.IndexingSeconds += seconds(now - start);
    aftermath.delay = throttle(_idx.op, now - locked, counters);
    aftermath.vacuumDue =
        !counters.VacuumInProgress && counters.HotSuffixes > _idx.op.MaxHotSuffixes;
  });
  if (batchBytes > kMaxKeptBatchBytes) _batch.emplace();
  if (!written) return std::nullopt;
  if (docID > newestBefore) {
    _newestDoc = docID;
    _newestZones.clear();
  }
  if (docID == _newestDoc && !holds(_newestZones, zoneID)) _newestZones.push_back(zoneID);
  return aftermath;
}

bool ZoneWriter::deleteDocs(const std::vector<uint32_t>& docIDs) {
  platform::MutexLock lock(_writeMutex);
  const auto before = _idx.deletedDocs();
  DocSet after = *before;
  for (const uint32_t docID : docIDs) {
    if (docID == 0) return refuse("Invalid DocID.");
    after.insert(docID);
  }
  if (after.size() == before->size()) return true;
  std::string bytes;
  bytes.reserve(after.size() * sizeof(uint32_t));
  after.forEach(
      [&bytes](uint32_t id) { bytes.append(reinterpret_cast<const char*>(&id), sizeof id); });
  leveldb::WriteBatch batch;
  batch.Put(kDeletedKey, bytes);
  return _idx.commitDeleted(&batch, std::move(after));
}

}  // namespace salt
