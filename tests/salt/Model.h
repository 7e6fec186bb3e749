#pragma once

#include <cstdint>
#include <map>
#include <random>
#include <set>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "salt/Index.h"

// A slow and obviously right model of the index, and what it takes to compare the two.
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

// All texts and suffixes of an index, in memory. The operations answer what the index should.
struct Model {
  explicit Model(salt::Index::Options options) : op(std::move(options)) {}

  bool addZone(uint32_t docID, uint16_t zoneID, const std::string& text,
               const std::vector<uint32_t>& offsets, bool merge);
  bool deleteDoc(uint32_t docID);

  // What a scan delivers: "docID,zoneID:offset", in order if the places know their shards.
  [[nodiscard]] std::vector<std::string> scan(std::string_view prefix) const;

  // The first counter of GetMetrics that is not as it should be, whatever the merges have done;
  // empty when all are.
  [[nodiscard]] std::string difference(const salt::Index::Metrics& metrics) const;

  salt::Index::Options op;
  std::map<std::pair<uint32_t, uint16_t>, std::string> texts;
  std::vector<Place> places;  // those of deleted documents too
  std::set<uint32_t> deleted;
  uint64_t indexingCalls = 0;
  uint32_t maxDocID = 0;
  uint32_t lastDocID = 0;
};

// A text of a small alphabet, so that suffixes share long prefixes, with blanks, some NULs and some
// bytes above 0x7F.
[[nodiscard]] std::string randomText(std::mt19937& random, size_t size);
[[nodiscard]] std::vector<uint32_t> randomOffsets(std::mt19937& random, std::string_view text);

// All keys and values of the database at `path`, which no index may have open, read with leveldb
// alone. Empty when there is none.
using Keys = std::map<std::string, std::string>;
[[nodiscard]] Keys readKeys(const std::string& path);

[[nodiscard]] salt::Index::Metrics storedMetrics(const Keys& keys);
[[nodiscard]] std::set<uint32_t> storedDeletions(const Keys& keys);

// Compares keys and model: each suffix is there exactly once, hot or in one page; pages are as the
// format has them; texts are whole; the metrics count what is there. The result is the first fault,
// or empty. The model's places learn which shards they are in.
[[nodiscard]] std::string difference(const Keys& keys, Model* model);

}  // namespace salttest
