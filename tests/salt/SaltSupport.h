#pragma once

#include <functional>
#include <memory>
#include <random>
#include <string>
#include <vector>

#include "salt/Index.h"

// A slow and obviously right model of the index, and the means to write shards by hand.
namespace salttest {

// One suffix as the model knows it.
struct Place {
  uint8_t shard = 0;
  uint32_t docID = 0;
  uint16_t zoneID = 0;
  uint32_t offset = 0;
  std::string text;  // cut

  // Order within an index: shard, then text, then the bytes of the tail.
  bool operator<(const Place& other) const;
};

[[nodiscard]] std::string naiveVarint(uint32_t value);
[[nodiscard]] std::string naiveCut(std::string_view text, const salt::Index::Options& op);

// A text of a small alphabet, so that suffixes share long prefixes, with blanks, some NULs and some
// bytes above 0x7F.
[[nodiscard]] std::string randomText(std::mt19937& random, size_t size);
[[nodiscard]] std::vector<uint32_t> randomOffsets(std::mt19937& random, std::string_view text);

// Adds pages of the places, which are of one shard, to the database at `path` and counts them into
// its metrics. No index may be open there. Page sizes are random, at most MaxPageSuffixes.
void writeShard(const std::string& path, std::vector<Place> places, std::mt19937& random);

// Writes one page as given.
void writePage(const std::string& path, uint8_t shard, const std::string& firstText,
               const std::vector<salt::SuffixMeta>& metas);

// Changes the stored metrics.
void editMetrics(const std::string& path, const std::function<void(salt::Index::Metrics&)>& edit);

// Writes, or with no value removes, a key.
void editKey(const std::string& path, const std::string& key, const std::string* value);

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

}  // namespace salttest
