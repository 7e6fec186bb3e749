#pragma once

#include <cstdint>
#include <functional>
#include <iosfwd>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "platform/TLError.h"

// The text index: finds every place at which a text begins with a given prefix.
//
// A document (DocID) has zones (ZoneID) such as its subject or its body, each with one text. A
// suffix is the text of a zone from the start of one token on, and the index holds all of them
// sorted, so that a search for a prefix is a range scan. One leveldb database per index; FORMAT.md
// has the bytes.
//
//   AddZone --> hot part --merge--> shard 1, shard 2, ... shard n
//               one key a suffix    each: page, page, page, ...
//
// The hot part takes new suffixes, one database key each. Once it is large, a background merge
// (Vacuum) moves its suffixes into one shard. A shard is a sorted run of pages, and a page is one
// key with up to MaxPageSuffixes consecutive suffixes: the first in full, the others as the
// difference from the one before. What a page leaves out is read from the stored text of the zone.
// A prefix scan seeks in the hot part and in every shard.
namespace salt {

// Version of the format. A database of any other version is not opened.
inline constexpr uint64_t CODE_VERSION = 304;

// The position of one suffix and what a page records of its text.
struct SuffixMeta {
  uint32_t DocID = 0;  // 0 in a search key, which has no position
  uint32_t Offset = 0;
  uint16_t ZoneID = 0;
  uint8_t lcp = 0;            // bytes shared with the previous suffix of the shard
  uint8_t extra[2] = {0, 0};  // the two bytes after those, 0 where the text ends

  // The order of the key tails in the database: bytewise over varint(ZoneID) varint(Offset)
  // varint(DocID), which is not numeric order.
  bool operator<(const SuffixMeta& other) const;

  // "[DocID,ZoneID:Offset (lcp)+"xy"]".
  explicit operator std::string() const;
};

// The document and zone of a suffix, without its offset.
struct Place {
  uint32_t DocID = 0;
  uint16_t ZoneID = 0;
};

class FoundPlaces;  // what a scan has found for one prefix; salt/PostingSet.h

// Threads: every operation may run on any thread, concurrently with the others. Readers work on a
// snapshot and block nobody; they do not see what is added or deleted while they run.
class Index {
 public:
  // The option fields in serialised layout: 40 bytes, little-endian.
  struct OptionsBlock {
    bool ValidateOnLoad = false;  // LoadIndex runs Validate
    uint8_t MinMatchLen = 32;     // a space at or after this position ends a suffix
    uint8_t MaxMatchLen = 100;    // upper bound of a suffix text in bytes
    uint8_t padding1[1] = {};
    uint32_t MaxZoneSize = 200000;        // upper bound of one zone's text in bytes
    uint32_t MaxPageSuffixes = 50;        // upper bound of suffixes in one page
    uint32_t MaxShardSuffixes = 1000000;  // suffix count at which the newest shard is full
    uint32_t MaxShards = 16;
    uint32_t MaxHotSuffixes = 500000;  // number of hot suffixes above which AddZone starts a merge
    bool CompactAfterVacuum = false;
    uint8_t padding2[3] = {};
    uint32_t ThrottleFactor = 0;       // multiplies the delay of AddZone; 0: no delay
    uint32_t MaxBatchBytes = 1000000;  // batch size at which a merge commits
    uint8_t padding3[4] = {};
  };

  struct Options : OptionsBlock {
    std::string Path = "saltdb";  // directory of the database

    [[nodiscard]] bool Valid() const;

    // False when the stream fails. A failed parse leaves the options unchanged.
    bool SerializeToOstream(std::ostream& stream) const;
    bool ParseFromIstream(std::istream& stream);
  };

  // The counters in serialised layout: 200 bytes, little-endian. Docs, Zones, TextBytes and
  // DeletedDocs are stored as 0; only GetMetrics counts them.
  struct MetricsBlock {
    uint64_t Docs = 0;
    uint64_t Zones = 0;
    uint64_t Suffixes = 0;  // ever added, in the hot part or in shards
    uint64_t TextBytes = 0;
    uint64_t DeletedDocs = 0;
    uint64_t Shards = 0;  // opened so far
    uint64_t LastShardSuffixes = 0;
    uint64_t HotSuffixes = 0;
    uint64_t Pages = 0;
    uint64_t IndexingCalls = 0;  // successful AddZone calls
    double IndexingSeconds = 0;
    double ThrottlingSeconds = 0;
    bool VacuumInProgress = false;
    uint8_t padding[7] = {};
    uint64_t Vacuums = 0;
    double VacuumSeconds = 0;
    uint64_t LastShardVacuumed = 0;
    uint64_t Scans = 0;
    double ScanSeconds = 0;
    uint64_t ScanResults = 0;      // suffixes passed to callbacks, or found by ScanPlaces
    uint64_t ScanTextFetches = 0;  // zone texts read to complete a suffix
    uint64_t ScanHotReads = 0;     // hot keys loaded
    uint64_t ScanPageReads = 0;    // pages loaded
    int64_t CreationTime = 0;      // seconds since 1970-01-01 UTC
    uint32_t MaxDocID = 0;
    uint32_t LastDocID = 0;
    uint64_t CodeVersion = 0;
  };

  struct Metrics : MetricsBlock {
    // Number of stored zones by ZoneID; filled by GetMetrics only, never serialised.
    std::unordered_map<uint16_t, uint64_t> ZoneCounts;

    // False when the stream fails. A failed parse leaves the metrics unchanged.
    bool SerializeToOstream(std::ostream& stream) const;
    bool ParseFromIstream(std::istream& stream);

    // Several lines for people to read, each ending with a newline.
    explicit operator std::string() const;
  };

  // Closes the database after the running merge has stopped.
  virtual ~Index() = default;

  [[nodiscard]] virtual const Options& GetOptions() const = 0;

  // The text of a suffix, read from the stored zone; empty when the zone is absent. For tools, as
  // GetOptions, ResetScanMetrics and Dump are; the daemon calls none of them.
  [[nodiscard]] virtual std::string GetSuffixText(const SuffixMeta& meta) const = 0;

  // Stores the text of a zone and indexes the suffixes that begin at `offsets` (ascending), in one
  // atomic write. If the zone already has a text, the call fails unless `merge` is set: then an
  // identical text succeeds without effect, and any other is appended after a NUL. True when the
  // zone is stored; false, with a log line, otherwise. The call may change `offsets`. With
  // throttling on it may sleep, holding no lock.
  virtual bool AddZone(uint32_t docID, uint16_t zoneID, std::string_view text,
                       std::vector<uint32_t>& offsets, bool merge) = 0;

  // Hides a document from all readers for good; its ID cannot be added again. True when it is
  // hidden afterwards. The cost grows with the number of deleted documents.
  virtual bool DeleteDoc(uint32_t docID) = 0;
  // Deletes all of the documents in one write or, on failure, none.
  virtual bool DeleteDocs(const std::vector<uint32_t>& docIDs) = 0;

  // Calls `callback` once for each suffix of a live document that begins with `prefix`: the hot
  // part first, then shard by shard, in suffix order within each. The prefix is truncated like a
  // suffix. The callback returns false to stop; it must not be empty. Always returns true; read
  // errors are logged and end the scan early.
  virtual bool ScanPrefix(std::string_view prefix,
                          std::function<bool(const SuffixMeta&)> callback) const = 0;

  // Calls `callback` for each stored zone of each live document, with the zones of a document one
  // after another. The text is valid during the call only. The callback returns false to stop.
  virtual void ForEachZone(
      std::function<bool(uint32_t docID, uint16_t zoneID, std::string_view text)> callback)
      const = 0;

  // Starts a background merge of the hot part into a shard if the hot part is at least half of
  // MaxHotSuffixes. A merge that is waiting for more suffixes begins at once.
  virtual void Vacuum() = 0;

  // True once everything that was added and deleted is on disk.
  virtual bool Sync() = 0;
  // Waits for the running merge, then compacts the whole database. False, with a log line, when the
  // disk has too little free space.
  virtual bool Compact() = 0;

  // Counts documents and zones by reading all stored text: for diagnosis.
  [[nodiscard]] virtual Metrics GetMetrics() const = 0;

  // Resets the counters from Scans to ScanPageReads, in memory only.
  virtual void ResetScanMetrics() = 0;

  // Reads the whole index and checks order, common prefixes and extra bytes. False, with a log
  // line, at the first fault; a wrong suffix count is only logged.
  [[nodiscard]] virtual bool Validate() const = 0;

  // The stored metrics and one line per suffix, including those of deleted documents.
  [[nodiscard]] virtual std::string Dump() const = 0;

  // ScanPrefix for callers that need only documents and zones, for several prefixes in one pass.
  // Memory: a bit for each prefix, zone and matching document and its neighbours. Null for a prefix
  // with which more than `limit` suffixes might begin: only ScanPrefix can then tell which come
  // first.
  [[nodiscard]] virtual std::vector<std::shared_ptr<const FoundPlaces>> ScanPlaces(
      const std::vector<std::string_view>& prefixes, uint64_t limit) const = 0;

  // For each prefix, the first `limit` suffixes that ScanPrefix would deliver, at a fraction of its
  // cost for many similar prefixes of which most match nothing. The first call starts the
  // background build of a Bloom filter over all suffixes, which makes later calls cheaper still.
  [[nodiscard]] virtual std::vector<std::vector<SuffixMeta>> ScanPrefixes(
      const std::vector<std::string>& prefixes, size_t limit) const = 0;

  // Backpressure for bulk ingest, called between two batches and without any lock that a search
  // needs: waits while a merge or a compaction on demand runs, because concurrent writes make these
  // much slower; 10 seconds at most.
  virtual void WaitForMaintenance() = 0;

  // Called before the index is deleted: merges stop after the current batch, and nothing waits for
  // merges or compactions any more.
  virtual void Interrupt() = 0;
};

// Creates an index in the directory `options.Path` and removes what was there. Null with an error
// when the system refuses. The caller owns the result.
[[nodiscard]] Index* NewIndex(const Index::Options& options, TLErrorOut error);
// The same; a failure ends the process.
[[nodiscard]] Index* NewIndex(const Index::Options& options);

// Opens the index in the directory `path` with the options it was created with; null, with a log
// line, on failure. The error is set only for a failure of the system, such as too few file
// descriptors: the index may be sound and may open later. The caller owns the result.
[[nodiscard]] Index* LoadIndex(const std::string& path, TLErrorOut error = nullptr);

}  // namespace salt
