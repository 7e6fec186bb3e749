#include "bench/RawBatches.h"

#include <leveldb/db.h>
#include <leveldb/write_batch.h>

#include <algorithm>
#include <memory>
#include <stdexcept>
#include <string_view>
#include <vector>

#include "bench/DaemonRun.h"
#include "salt/Coding.h"
#include "salt/Database.h"
#include "salt/Index.h"

namespace bench {

namespace {

// The text of one zone and its suffixes, as ranges of the common arrays.
struct Zone {
  uint32_t docID;
  uint16_t zoneID;
  size_t text;
  size_t textSize;
  size_t offsets = 0;
  size_t offsetCount = 0;
};

// The contents of a finished index, document by document. Takes 8 bytes per suffix besides all
// texts.
struct IndexContents {
  salt::Index::OptionsBlock options;
  std::string texts;
  std::vector<Zone> zones;
  // Document, zone and offset of each suffix, packed so that numeric order is the order of zones.
  std::vector<uint64_t> suffixes;

  static constexpr unsigned kZoneShift = 18;
  static constexpr unsigned kDocShift = 32;
  static uint64_t packed(uint32_t docID, uint16_t zoneID, uint32_t offset) {
    return uint64_t{docID} << kDocShift | uint64_t{zoneID} << kZoneShift | offset;
  }
  static uint32_t offsetOf(uint64_t suffix) {
    return static_cast<uint32_t>(suffix & ((1U << kZoneShift) - 1));
  }
};

void collectSuffixes(const salt::Index& index, IndexContents& contents) {
  bool fit = true;
  index.ScanPrefix("", [&](const salt::SuffixMeta& meta) {
    fit = meta.Offset >> IndexContents::kZoneShift == 0 &&
          meta.ZoneID >> (IndexContents::kDocShift - IndexContents::kZoneShift) == 0;
    contents.suffixes.push_back(IndexContents::packed(meta.DocID, meta.ZoneID, meta.Offset));
    return fit;
  });
  if (!fit) throw std::runtime_error("a suffix does not fit into 64 bits");
  std::sort(contents.suffixes.begin(), contents.suffixes.end());
}

IndexContents readIndex(const std::string& path) {
  const std::unique_ptr<salt::Index> index(salt::LoadIndex(path));
  if (index == nullptr) throw std::runtime_error("the index cannot be opened again");
  IndexContents contents;
  contents.options = index->GetOptions();
  index->ForEachZone([&](uint32_t docID, uint16_t zoneID, std::string_view text) {
    contents.zones.push_back({docID, zoneID, contents.texts.size(), text.size()});
    contents.texts.append(text);
    return true;
  });
  std::sort(contents.zones.begin(), contents.zones.end(), [](const Zone& a, const Zone& b) {
    return std::pair(a.docID, a.zoneID) < std::pair(b.docID, b.zoneID);
  });
  collectSuffixes(*index, contents);
  size_t at = 0;
  for (Zone& zone : contents.zones) {
    const uint64_t end = IndexContents::packed(zone.docID, zone.zoneID, 0) +
                         (uint64_t{1} << IndexContents::kZoneShift);
    zone.offsets = at;
    while (at < contents.suffixes.size() && contents.suffixes[at] < end) ++at;
    zone.offsetCount = at - zone.offsets;
  }
  if (at != contents.suffixes.size()) throw std::runtime_error("a suffix has no zone");
  return contents;
}

}  // namespace

RawRun writeRawBatches(const std::string& indexPath, const std::string& path) {
  const IndexContents contents = readIndex(indexPath);
  const salt::Database database = salt::openDatabase(path, salt::OpenMode::create);
  if (database.db == nullptr) throw std::runtime_error("the raw database cannot be made");
  leveldb::WriteBatch batch;
  std::string key;
  const double start = secondsNow();
  const double cpuStart = cpuSecondsNow();
  for (const Zone& zone : contents.zones) {
    const auto text = std::string_view(contents.texts).substr(zone.text, zone.textSize);
    constexpr uint8_t kTextShard = 255;
    batch.Clear();
    batch.Put(salt::slice(salt::TextKey(kTextShard, zone.docID, zone.zoneID).view()),
              salt::slice(text));
    salt::SuffixMeta meta;
    meta.DocID = zone.docID;
    meta.ZoneID = zone.zoneID;
    for (size_t i = 0; i < zone.offsetCount; ++i) {
      meta.Offset = IndexContents::offsetOf(contents.suffixes[zone.offsets + i]);
      const std::string_view suffix = text.substr(meta.Offset);
      salt::suffixKey(0, suffix.substr(0, salt::suffixLength(suffix, contents.options)), meta,
                      &key);
      batch.Put(key, {});
    }
    const leveldb::Status status = database.db->Write(leveldb::WriteOptions(), &batch);
    if (!status.ok()) throw std::runtime_error("raw database: " + status.ToString());
  }
  return {contents.suffixes.size(), secondsNow() - start, cpuSecondsNow() - cpuStart};
}

}  // namespace bench
