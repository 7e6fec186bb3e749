#pragma once

#include <cstdint>
#include <functional>
#include <iosfwd>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "platform/TLError.h"

// A suffix index on disk over short texts: tells which (document, zone, offset) places have a text
// that begins with a prefix. One leveldb database per index; FORMAT.md has the bytes.
namespace salt {

// Version of the format. A database of any other version is not opened.
inline constexpr uint64_t CODE_VERSION = 304;

// One place at which a suffix begins, with what a page knows of its text.
struct SuffixMeta {
  uint32_t DocID = 0;  // 0 marks a search key, which has no place
  uint32_t Offset = 0;
  uint16_t ZoneID = 0;
  uint8_t lcp = 0;            // bytes in common with the suffix before it in the shard
  uint8_t extra[2] = {0, 0};  // the two bytes after those, 0 where the text ends

  // The order of the key tails in the database: bytewise over varint(ZoneID) varint(Offset)
  // varint(DocID), which is not the order of the numbers.
  bool operator<(const SuffixMeta& other) const;

  // "[DocID,ZoneID:Offset (lcp)+"xy"]".
  explicit operator std::string() const;
};

// Where a suffix stands, but for its offset.
struct Place {
  uint32_t DocID = 0;
  uint16_t ZoneID = 0;
};

// All places of a document: bit n for the zone n of some list, which has at most 32.
struct DocZones {
  uint32_t DocID = 0;
  uint32_t zones = 0;
};

// Takes places, a run of documents at a time, with the list that their zones are of. Both live for
// the call.
using PlacesCallback =
    std::function<void(const std::vector<uint16_t>& zones, const DocZones* docs, size_t count)>;

// Threads: all operations may run on any threads at once. Readers work from a snapshot and block
// nobody; what is added or deleted while one runs does not change what it sees.
class Index {
 public:
  // The members of the stream, in its layout: 40 bytes, little-endian.
  struct OptionsBlock {
    bool ValidateOnLoad = false;  // LoadIndex runs Validate
    uint8_t MinMatchLen = 32;     // a blank at or past this position ends a suffix
    uint8_t MaxMatchLen = 100;    // most bytes of a suffix text
    uint8_t padding1[1] = {};
    uint32_t MaxZoneSize = 200000;        // most bytes in one zone's text
    uint32_t MaxPageSuffixes = 50;        // most suffixes in one page
    uint32_t MaxShardSuffixes = 1000000;  // suffix count at which the newest shard is full
    uint32_t MaxShards = 16;
    uint32_t MaxHotSuffixes = 500000;  // hot suffix count above which AddZone starts a vacuum
    bool CompactAfterVacuum = false;
    uint8_t padding2[3] = {};
    uint32_t ThrottleFactor = 0;       // multiplier of the delay of AddZone; 0: never any
    uint32_t MaxBatchBytes = 1000000;  // size at which a merge commits
    uint8_t padding3[4] = {};
  };

  struct Options : OptionsBlock {
    std::string Path = "saltdb";  // directory of the database

    [[nodiscard]] bool Valid() const;

    // False when the stream fails. After a failed parse the options are what they were.
    bool SerializeToOstream(std::ostream& stream) const;
    bool ParseFromIstream(std::istream& stream);
  };

  // The counters of the stream, in its layout: 200 bytes, little-endian. Docs, Zones, TextBytes and
  // DeletedDocs are stored as 0 and counted by GetMetrics only.
  struct MetricsBlock {
    uint64_t Docs = 0;
    uint64_t Zones = 0;
    uint64_t Suffixes = 0;  // ever added, hot or in shards
    uint64_t TextBytes = 0;
    uint64_t DeletedDocs = 0;
    uint64_t Shards = 0;  // opened so far
    uint64_t LastShardSuffixes = 0;
    uint64_t HotSuffixes = 0;
    uint64_t Pages = 0;
    uint64_t IndexingCalls = 0;  // successful calls of AddZone
    double IndexingSeconds = 0;
    double ThrottlingSeconds = 0;
    bool VacuumInProgress = false;
    uint8_t padding[7] = {};
    uint64_t Vacuums = 0;
    double VacuumSeconds = 0;
    uint64_t LastShardVacuumed = 0;
    uint64_t Scans = 0;
    double ScanSeconds = 0;
    uint64_t ScanResults = 0;      // suffixes handed to callbacks
    uint64_t ScanTextFetches = 0;  // zone texts read to complete a suffix
    uint64_t ScanHotReads = 0;     // hot keys loaded
    uint64_t ScanPageReads = 0;    // pages loaded
    int64_t CreationTime = 0;      // seconds since 1970-01-01 UTC
    uint32_t MaxDocID = 0;
    uint32_t LastDocID = 0;
    uint64_t CodeVersion = 0;
  };

  struct Metrics : MetricsBlock {
    // Stored zones by their ID; filled by GetMetrics only, never on the stream.
    std::unordered_map<uint16_t, uint64_t> ZoneCounts;

    // False when the stream fails. After a failed parse the metrics are what they were.
    bool SerializeToOstream(std::ostream& stream) const;
    bool ParseFromIstream(std::istream& stream);

    // Several lines for a human, each with its line end.
    explicit operator std::string() const;
  };

  // Closes the database. Waits for a running merge.
  virtual ~Index() = default;

  [[nodiscard]] virtual const Options& GetOptions() const = 0;

  // The text of a suffix, read from the stored zone; empty when there is none.
  [[nodiscard]] virtual std::string GetSuffixText(const SuffixMeta& meta) const = 0;

  // Stores the text of a zone and makes the suffixes that begin at `offsets` (ascending) findable,
  // in one atomic write. A zone that has text already: with `merge` the same text is a success
  // without effect, another is appended behind a NUL; without `merge` the call fails. True when the
  // zone is stored; false, with a log line, otherwise. The call may change `offsets`. It may sleep,
  // holding no lock, when throttling is on.
  virtual bool AddZone(uint32_t docID, uint16_t zoneID, std::string_view text,
                       std::vector<uint32_t>& offsets, bool merge) = 0;

  // Hides a document from all readers for good; its ID cannot be added again. True when it is
  // hidden afterwards. The cost grows with the number of deleted documents.
  virtual bool DeleteDoc(uint32_t docID) = 0;
  // The same for all of them or, when it fails, none, at the cost of one.
  virtual bool DeleteDocs(const std::vector<uint32_t>& docIDs) = 0;

  // Calls `callback` once for each suffix of a live document that begins with `prefix`, hot ones
  // first, then shard by shard, in suffix order within each. The prefix is cut as a suffix is. The
  // callback returns false to stop; it must not be empty. Always true; errors are logged and end
  // the scan early.
  virtual bool ScanPrefix(std::string_view prefix,
                          std::function<bool(const SuffixMeta&)> callback) const = 0;

  // Calls `callback` for each stored zone of each live document, the zones of a document one after
  // the other. The text lives for the call. The callback returns false to stop.
  virtual void ForEachZone(
      std::function<bool(uint32_t docID, uint16_t zoneID, std::string_view text)> callback)
      const = 0;

  // Starts to move the hot suffixes into a shard, in the background, if that is worthwhile. One
  // that waits for more begins at once.
  virtual void Vacuum() = 0;

  // True once all that was added and deleted is on the disk.
  virtual bool Sync() = 0;
  // Waits for a merge that runs, then compacts all. False, with a log line, where the disk lacks
  // the room for it.
  virtual bool Compact() = 0;

  // Reads all stored text to count it: for diagnosis.
  [[nodiscard]] virtual Metrics GetMetrics() const = 0;

  // Sets Scans to ScanPageReads to zero, in memory only.
  virtual void ResetScanMetrics() = 0;

  // Reads the whole index and checks order, common prefixes and extra bytes. False, with a log
  // line, at the first fault; a wrong count of suffixes is logged but is no fault.
  [[nodiscard]] virtual bool Validate() const = 0;

  // The stored metrics and one line per suffix, deleted ones included.
  [[nodiscard]] virtual std::string Dump() const = 0;

  // ScanPrefix for those who ask in which zones of which documents there is a match: calls
  // `callback` with runs of places, in any order, each place once or more. The result is the number
  // of matching suffixes. Null, and no call, when there might be more than `limit`: then only
  // ScanPrefix can tell which come first.
  virtual std::optional<uint64_t> ScanPlaces(std::string_view prefix, uint64_t limit,
                                             const PlacesCallback& callback) const = 0;

  // For each prefix the first `limit` suffixes that ScanPrefix would call with: for many prefixes
  // that are alike, most of which nothing begins with, at a fraction of its cost. The first call
  // has the index learn in the background with what its suffixes begin; later ones cost less still.
  [[nodiscard]] virtual std::vector<std::vector<SuffixMeta>> ScanPrefixes(
      const std::vector<std::string>& prefixes, size_t limit) const = 0;

  // For those who add a lot, between two batches and holding nothing that a search needs: waits
  // while a merge or a compaction runs, which costs much more while much is added; 10 seconds at
  // most.
  virtual void WaitWhileTidying() = 0;

  // For who is about to delete the index: merges end with the batch in hand, and nobody waits for
  // them or for compactions any more.
  virtual void Interrupt() = 0;
};

// Makes a new index in the directory `options.Path`; what was there is removed. Null with an error
// when the system does not let it. The caller owns the result.
[[nodiscard]] Index* NewIndex(const Index::Options& options, TLErrorOut error);
// The same, where a failure ends the process.
[[nodiscard]] Index* NewIndex(const Index::Options& options);

// Opens the index in the directory `path`, with the options it was made with; null, with a log
// line, on failure. The error is set when that is the system's, for want of descriptors, say: there
// may be a sound index, and it may be opened later. The caller owns the result.
[[nodiscard]] Index* LoadIndex(const std::string& path, TLErrorOut error = nullptr);

}  // namespace salt
