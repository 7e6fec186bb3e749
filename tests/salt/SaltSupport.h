#pragma once

#include <filesystem>
#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "salt/Index.h"

// Short forms for operations of an index, and functions that change a database directly.
namespace salttest {

// Writes one page.
void writePage(const std::string& path, uint8_t shard, const std::string& firstText,
               const std::vector<salt::SuffixMeta>& metas);

// Changes the stored metrics.
void editMetrics(const std::string& path, const std::function<void(salt::Index::Metrics&)>& edit);

// Writes a key or, without a value, removes it.
void editKey(const std::string& path, const std::string& key, const std::string* value);

// The files of the database at `path` whose names contain `part`, in the order of their names.
[[nodiscard]] std::vector<std::filesystem::path> filesOf(const std::string& path,
                                                         std::string_view part);

// The newest write-ahead log of the database at `path`.
[[nodiscard]] std::filesystem::path newestLog(const std::string& path);

[[nodiscard]] std::unique_ptr<salt::Index> newIndex(const std::string& path,
                                                    salt::Index::Options options = {});
[[nodiscard]] std::unique_ptr<salt::Index> loadIndex(const std::string& path);

// Adds a zone whose tokens begin at `offsets`, with merging.
bool addZone(salt::Index& index, uint32_t docID, uint16_t zoneID, const std::string& text,
             std::vector<uint32_t> offsets = {0});

// Offset 0 and the offsets of the bytes after a space.
[[nodiscard]] std::vector<uint32_t> wordOffsets(std::string_view text);

// "docID,zoneID:offset"
[[nodiscard]] std::string printed(const salt::SuffixMeta& suffix);

// The suffixes of a scan, printed, in order.
[[nodiscard]] std::vector<std::string> scan(const salt::Index& index, std::string_view prefix);

// The places of suffixes, "docID,zoneID", and the number of suffixes.
struct Places {
  std::set<std::string> places;
  uint64_t suffixes = 0;
  bool operator==(const Places&) const = default;
};

// The result of ScanPlaces for one prefix, which may use posting lists and the cache; and of a
// scan, which reads the pages.
[[nodiscard]] std::optional<Places> scanPlaces(const salt::Index& index, std::string_view prefix,
                                               uint64_t limit = UINT64_MAX);
[[nodiscard]] Places placesOf(const std::vector<std::string>& suffixes);

}  // namespace salttest
