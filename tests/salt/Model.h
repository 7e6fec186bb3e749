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

// A slow and obviously correct model of the index, and functions to compare the two.
namespace salttest {

// One suffix in the model.
struct Place {
  uint8_t shard = 0;
  uint32_t docID = 0;
  uint16_t zoneID = 0;
  uint32_t offset = 0;
  std::string text;  // truncated

  // Order within an index: shard, then text, then the bytes of the tail.
  bool operator<(const Place& other) const;
};

[[nodiscard]] std::string naiveVarint(uint32_t value);
[[nodiscard]] std::string naiveCut(std::string_view text, const salt::Index::Options& op);

// All texts and suffixes of an index, in memory. Operations return what the index should return.
struct Model {
  explicit Model(salt::Index::Options options) : op(std::move(options)) {}

  bool addZone(uint32_t docID, uint16_t zoneID, const std::string& text,
               const std::vector<uint32_t>& offsets, bool merge);
  bool deleteDoc(uint32_t docID);

  // The expected result of a scan: "docID,zoneID:offset", in order if the shards of the places are
  // known.
  [[nodiscard]] std::vector<std::string> scan(std::string_view prefix) const;

  // The first counter of GetMetrics that is wrong, whatever merges have run; empty if all are
  // correct.
  [[nodiscard]] std::string difference(const salt::Index::Metrics& metrics) const;

  salt::Index::Options op;
  std::map<std::pair<uint32_t, uint16_t>, std::string> texts;
  std::vector<Place> places;  // including those of deleted documents
  std::set<uint32_t> deleted;
  uint64_t indexingCalls = 0;
  uint32_t maxDocID = 0;
  uint32_t lastDocID = 0;
};

// One call of AddZone or, if `zoneID` is 0, of DeleteDoc.
struct Operation {
  uint32_t docID = 0;
  uint16_t zoneID = 0;
  std::string text;
  std::vector<uint32_t> offsets;
  bool merge = true;
};

// Applies an operation to the index or the model, and returns its answer.
bool carryOut(salt::Index& index, Operation operation);
bool carryOut(Model& model, const Operation& operation);

// A text with a small alphabet, so that suffixes share long prefixes, with spaces, some NULs and
// some bytes above 0x7F.
[[nodiscard]] std::string randomText(std::mt19937& random, size_t size);
[[nodiscard]] std::vector<uint32_t> randomOffsets(std::mt19937& random, std::string_view text);

// All keys and values of the database at `path`, which no index may have open, read with leveldb
// only. Empty if there is none.
using Keys = std::map<std::string, std::string>;
[[nodiscard]] Keys readKeys(const std::string& path);

[[nodiscard]] salt::Index::Metrics storedMetrics(const Keys& keys);
[[nodiscard]] std::set<uint32_t> storedDeletions(const Keys& keys);

// Compares keys and model: each suffix exists exactly once, hot or in one page; pages follow the
// format; texts are complete; the metrics are correct. Returns the first fault, or empty. Sets the
// shards of the model's places.
[[nodiscard]] std::string difference(const Keys& keys, Model* model);

}  // namespace salttest
