#include "tests/salt/SaltSupport.h"

#include <fmt/format.h>
#include <gtest/gtest.h>
#include <signal.h>

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

std::filesystem::path newestLog(const std::string& path) {
  std::filesystem::path newest;
  for (const auto& entry : std::filesystem::directory_iterator(path)) {
    // Names are numbers of equal width.
    if (entry.path().extension() == ".log") newest = std::max(newest, entry.path());
  }
  return newest;
}

FileSizeLimit::FileSizeLimit(uint64_t bytes) {
  signal(SIGXFSZ, SIG_IGN);
  getrlimit(RLIMIT_FSIZE, &_before);
  const rlimit low{bytes, _before.rlim_max};
  TL_ASSERT(setrlimit(RLIMIT_FSIZE, &low) == 0);
}

FileSizeLimit::~FileSizeLimit() {
  setrlimit(RLIMIT_FSIZE, &_before);
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

std::vector<std::pair<uint32_t, uint16_t>> placesOf(const std::vector<uint16_t>& zones,
                                                    const salt::DocZones* docs, size_t count) {
  std::vector<std::pair<uint32_t, uint16_t>> places;
  for (const salt::DocZones* doc = docs; doc != docs + count; ++doc) {
    for (size_t zone = 0; zone < zones.size(); ++zone) {
      if ((doc->zones >> zone & 1) != 0) places.emplace_back(doc->DocID, zones[zone]);
    }
  }
  return places;
}

std::optional<uint64_t> scanPlaces(const salt::Index& index, std::string_view prefix,
                                   uint64_t limit, const salt::PlacesCallback& callback) {
  const auto found = index.ScanPlaces({prefix}, limit);
  if (found.front() == nullptr) return std::nullopt;
  found.front()->deliver(callback);
  return found.front()->suffixes();
}

}  // namespace salttest
