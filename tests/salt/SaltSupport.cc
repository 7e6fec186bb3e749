#include "tests/salt/SaltSupport.h"

#include <fmt/format.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <sstream>

#include "platform/Assert.h"
#include "salt/Coding.h"
#include "salt/Database.h"
#include "salt/PostingSet.h"
#include "tests/salt/Model.h"

namespace salttest {

void writePage(const std::string& path, uint8_t shard, const std::string& firstText,
               const std::vector<salt::SuffixMeta>& metas) {
  std::string key;
  std::string value;
  salt::suffixKey(shard, firstText, metas.front(), &key);
  salt::pageToValue(metas.data(), metas.size(), &value);
  editKey(path, key, &value);
  editMetrics(path, [&](salt::Index::Metrics& metrics) {
    metrics.Shards = std::max<uint64_t>(metrics.Shards, shard);
    metrics.Pages += 1;
    metrics.Suffixes += metas.size();
  });
}

void editMetrics(const std::string& path, const std::function<void(salt::Index::Metrics&)>& edit) {
  salt::Index::Metrics metrics = storedMetrics(readKeys(path));
  edit(metrics);
  std::ostringstream stream;
  TL_ASSERT(metrics.SerializeToOstream(stream));
  const std::string bytes = stream.str();
  editKey(path, "\xFFMETRICS", &bytes);
}

void editKey(const std::string& path, const std::string& key, const std::string* value) {
  salt::Database database = salt::openDatabase(path, salt::OpenMode::existing);
  TL_ASSERT((value ? database.db->Put({}, key, *value) : database.db->Delete({}, key)).ok());
}

std::vector<std::filesystem::path> filesOf(const std::string& path, std::string_view part) {
  std::vector<std::filesystem::path> found;
  for (const auto& entry : std::filesystem::directory_iterator(path)) {
    if (entry.path().filename().string().find(part) != std::string::npos) found.push_back(entry);
  }
  std::sort(found.begin(), found.end());
  return found;
}

std::filesystem::path newestLog(const std::string& path) {
  return filesOf(path, ".log").back();  // names are numbers of equal width
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

std::string printed(const salt::SuffixMeta& suffix) {
  return fmt::format("{},{}:{}", suffix.DocID, suffix.ZoneID, suffix.Offset);
}

std::vector<std::string> scan(const salt::Index& index, std::string_view prefix) {
  std::vector<std::string> found;
  EXPECT_TRUE(index.ScanPrefix(prefix, [&found](const salt::SuffixMeta& suffix) {
    found.push_back(printed(suffix));
    return true;
  }));
  return found;
}

std::optional<Places> scanPlaces(const salt::Index& index, std::string_view prefix,
                                 uint64_t limit) {
  const auto found = index.ScanPlaces({prefix}, limit);
  if (found.front() == nullptr) return std::nullopt;
  Places all{{}, found.front()->suffixes()};
  found.front()->forEachZone([&all](uint16_t zone, const salt::DocSet& docs) {
    docs.forEach([&](uint32_t docID) { all.places.insert(fmt::format("{},{}", docID, zone)); });
  });
  return all;
}

Places placesOf(const std::vector<std::string>& suffixes) {
  Places all{{}, suffixes.size()};
  for (const std::string& suffix : suffixes) {
    all.places.insert(suffix.substr(0, suffix.find(':')));
  }
  return all;
}

}  // namespace salttest
