#pragma once

#include <sys/resource.h>

#include <filesystem>
#include <functional>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "salt/Index.h"

// Short forms of what tests do with an index, and the means to change a database by hand.
namespace salttest {

// Writes one page as given.
void writePage(const std::string& path, uint8_t shard, const std::string& firstText,
               const std::vector<salt::SuffixMeta>& metas);

// Changes the stored metrics.
void editMetrics(const std::string& path, const std::function<void(salt::Index::Metrics&)>& edit);

// Writes, or with no value removes, a key.
void editKey(const std::string& path, const std::string& key, const std::string* value);

// The newest write-ahead log of the database at `path`.
[[nodiscard]] std::filesystem::path newestLog(const std::string& path);

// While it lives, writes past this size of a file fail half done, as on a full disk.
class FileSizeLimit {
 public:
  explicit FileSizeLimit(uint64_t bytes);
  ~FileSizeLimit();
  FileSizeLimit(const FileSizeLimit&) = delete;
  FileSizeLimit& operator=(const FileSizeLimit&) = delete;

 private:
  rlimit _before{};
};

[[nodiscard]] std::unique_ptr<salt::Index> newIndex(const std::string& path,
                                                    salt::Index::Options options = {});
[[nodiscard]] std::unique_ptr<salt::Index> loadIndex(const std::string& path);

// Adds a zone whose tokens begin at `offsets`, merging.
bool addZone(salt::Index& index, uint32_t docID, uint16_t zoneID, const std::string& text,
             std::vector<uint32_t> offsets = {0});

// The offsets of the bytes that follow a blank, and 0.
[[nodiscard]] std::vector<uint32_t> wordOffsets(std::string_view text);

// What a scan delivers: "docID,zoneID:offset" in order.
[[nodiscard]] std::vector<std::string> scan(const salt::Index& index, std::string_view prefix);

// The places of a run, as (docID, zoneID).
[[nodiscard]] std::vector<std::pair<uint32_t, uint16_t>> placesOf(
    const std::vector<uint16_t>& zones, const salt::DocZones* docs, size_t count);

}  // namespace salttest
