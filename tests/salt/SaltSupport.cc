#include "tests/salt/SaltSupport.h"

#include <fmt/format.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <sstream>
#include <tuple>

#include "platform/Assert.h"
#include "salt/Coding.h"
#include "salt/Database.h"

namespace salttest {

namespace {

size_t commonPrefix(const std::string& left, const std::string& right) {
  size_t n = 0;
  while (n < left.size() && n < right.size() && left[n] == right[n]) ++n;
  return n;
}

salt::Index::Metrics storedMetrics(leveldb::DB& db) {
  std::string bytes;
  TL_ASSERT(db.Get({}, "\xFFMETRICS", &bytes).ok());
  std::istringstream stream(bytes);
  salt::Index::Metrics metrics;
  TL_ASSERT(metrics.ParseFromIstream(stream));
  return metrics;
}

void storeMetrics(leveldb::DB& db, const salt::Index::Metrics& metrics) {
  std::ostringstream stream;
  TL_ASSERT(metrics.SerializeToOstream(stream));
  TL_ASSERT(db.Put({}, "\xFFMETRICS", stream.str()).ok());
}

void putPage(leveldb::DB& db, uint8_t shard, const std::string& firstText,
             const std::vector<salt::SuffixMeta>& metas) {
  std::string key;
  std::string value;
  salt::suffixKey(shard, firstText, metas.front(), &key);
  salt::pageToValue(metas.data(), metas.size(), &value);
  TL_ASSERT(db.Put({}, key, value).ok());
}

}  // namespace

bool Place::operator<(const Place& other) const {
  const auto key = [](const Place& p) {
    return std::tuple(p.shard, p.text,
                      naiveVarint(p.zoneID) + naiveVarint(p.offset) + naiveVarint(p.docID));
  };
  return key(*this) < key(other);
}

std::string naiveVarint(uint32_t value) {
  std::string bytes;
  do {
    bytes += static_cast<char>((value & 127) + (value > 127 ? 128 : 0));
    value /= 128;
  } while (value > 0);
  return bytes;
}

std::string naiveCut(std::string_view text, const salt::Index::Options& op) {
  std::string cut;
  for (size_t i = 0; i < text.size() && i < op.MaxMatchLen; ++i) {
    if (text[i] == '\0') break;
    cut += text[i];
    if (text[i] == ' ' && i >= op.MinMatchLen) break;
  }
  return cut;
}

std::string randomText(std::mt19937& random, size_t size) {
  std::string text;
  while (text.size() < size) {
    const auto dice = random() % 100;
    if (dice < 2) {
      text += '\0';
    } else if (dice < 4) {
      text += static_cast<char>(0x80 + random() % 0x80);
    } else if (dice < 20) {
      text += ' ';
    } else if (dice < 25 && text.size() > 2) {
      text += text.substr(random() % text.size());  // long repeats
    } else {
      text += static_cast<char>('a' + random() % 3);
    }
  }
  text.resize(size);
  return text;
}

std::vector<uint32_t> randomOffsets(std::mt19937& random, std::string_view text) {
  std::vector<uint32_t> offsets;
  for (uint32_t i = 0; i < text.size(); ++i) {
    if (text[i] != '\0' && random() % 3 == 0) offsets.push_back(i);
  }
  return offsets;
}

void writeShard(const std::string& path, std::vector<Place> places, std::mt19937& random) {
  salt::Database database = salt::openDatabase(path, salt::OpenMode::existing);
  salt::Index::Metrics metrics = storedMetrics(*database.db);
  std::sort(places.begin(), places.end());
  for (size_t at = 0; at < places.size();) {
    const size_t count = std::min<size_t>(places.size() - at, 1 + random() % 50);
    std::vector<salt::SuffixMeta> metas(count);
    for (size_t i = 0; i < count; ++i) {
      const Place& place = places[at + i];
      metas[i] = {place.docID, place.offset, place.zoneID, 0, {0, 0}};
      if (i == 0) continue;
      const size_t lcp = commonPrefix(places[at + i - 1].text, place.text);
      metas[i].lcp = static_cast<uint8_t>(lcp);
      for (size_t n = 0; n < 2 && lcp + n < place.text.size(); ++n) {
        metas[i].extra[n] = static_cast<uint8_t>(place.text[lcp + n]);
      }
    }
    putPage(*database.db, places[at].shard, places[at].text, metas);
    metrics.Shards = std::max<uint64_t>(metrics.Shards, places[at].shard);
    metrics.Pages += 1;
    metrics.Suffixes += count;
    at += count;
  }
  storeMetrics(*database.db, metrics);
}

void writePage(const std::string& path, uint8_t shard, const std::string& firstText,
               const std::vector<salt::SuffixMeta>& metas) {
  salt::Database database = salt::openDatabase(path, salt::OpenMode::existing);
  salt::Index::Metrics metrics = storedMetrics(*database.db);
  putPage(*database.db, shard, firstText, metas);
  metrics.Shards = std::max<uint64_t>(metrics.Shards, shard);
  metrics.Pages += 1;
  metrics.Suffixes += metas.size();
  storeMetrics(*database.db, metrics);
}

void editMetrics(const std::string& path, const std::function<void(salt::Index::Metrics&)>& edit) {
  salt::Database database = salt::openDatabase(path, salt::OpenMode::existing);
  salt::Index::Metrics metrics = storedMetrics(*database.db);
  edit(metrics);
  storeMetrics(*database.db, metrics);
}

void editKey(const std::string& path, const std::string& key, const std::string* value) {
  salt::Database database = salt::openDatabase(path, salt::OpenMode::existing);
  TL_ASSERT((value ? database.db->Put({}, key, *value) : database.db->Delete({}, key)).ok());
}

std::unique_ptr<salt::Index> newIndex(const std::string& path, salt::Index::Options options) {
  options.Path = path;
  return std::unique_ptr<salt::Index>(salt::NewIndex(options));
}

std::unique_ptr<salt::Index> loadIndex(const std::string& path) {
  return std::unique_ptr<salt::Index>(salt::LoadIndex(path));
}

bool addZone(salt::Index& index, uint32_t docID, uint16_t zoneID, const std::string& text,
             std::vector<uint32_t> offsets) {
  return index.AddZone(docID, zoneID, text, offsets, true);
}

std::vector<uint32_t> wordOffsets(std::string_view text) {
  std::vector<uint32_t> offsets;
  for (uint32_t i = 0; i < text.size(); ++i) {
    if (text[i] != ' ' && (i == 0 || text[i - 1] == ' ')) offsets.push_back(i);
  }
  return offsets;
}

std::vector<std::string> scan(const salt::Index& index, std::string_view prefix) {
  std::vector<std::string> found;
  EXPECT_TRUE(index.ScanPrefix(prefix, [&found](const salt::SuffixMeta& meta) {
    found.push_back(fmt::format("{},{}:{}", meta.DocID, meta.ZoneID, meta.Offset));
    return true;
  }));
  return found;
}

}  // namespace salttest
