#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <filesystem>
#include <set>

#include "salt/IndexImpl.h"
#include "tests/salt/FaultInjectionEnv.h"
#include "tests/salt/Model.h"
#include "tests/salt/SaltSupport.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TemporaryDirectory.h"

// A disk that becomes full at any point of a merge.
namespace {

using salt::Index;
using salttest::addZone;
using salttest::loadIndex;
using salttest::scan;
using testsupport::LogCapture;
using testsupport::TemporaryDirectory;

// Limits the total bytes written. A write that does not fit is truncated and fails, as on a real
// disk.
class FullDiskEnv final : public salttest::FaultInjectionEnv {
 public:
  void setBytesLeft(int64_t bytes) { _bytesLeft = bytes; }
  [[nodiscard]] int64_t bytesLeft() const { return _bytesLeft; }

 private:
  class File final : public salttest::FaultInjectionFile {
   public:
    File(FullDiskEnv* disk, leveldb::WritableFile* file) : FaultInjectionFile(file), _disk(*disk) {}
    leveldb::Status Append(const leveldb::Slice& data) override {
      const auto size = static_cast<int64_t>(data.size());
      const int64_t left = std::max<int64_t>(_disk._bytesLeft.fetch_sub(size), 0);
      if (left >= size) return FaultInjectionFile::Append(data);
      static_cast<void>(FaultInjectionFile::Append({data.data(), static_cast<size_t>(left)}));
      static_cast<void>(Flush());
      return leveldb::Status::IOError("No space left on device");
    }

   private:
    FullDiskEnv& _disk;
  };

  leveldb::WritableFile* wrap(const std::string&, leveldb::WritableFile* file) override {
    return new File(this, file);
  }

  std::atomic<int64_t> _bytesLeft{INT64_MAX};
};

constexpr uint32_t kMaxHotSuffixes = 600;

void addDocs(Index& index, uint32_t from, uint32_t to) {
  std::mt19937 random(from);
  for (uint32_t docID = from; docID < to; ++docID) {
    const std::string text = salttest::randomText(random, 60);
    ASSERT_TRUE(addZone(index, docID, 1, text, salttest::randomOffsets(random, text)));
  }
}

// An index with a shard and a hot part whose merge takes several commits. Merges start on request
// only.
void makeIndex(const std::string& path) {
  Index::Options options;
  options.MaxHotSuffixes = kMaxHotSuffixes;
  options.MaxPageSuffixes = 5;
  options.MaxBatchBytes = 2000;
  auto index = salttest::newIndex(path, options);
  addDocs(*index, 1, 20);
  index->Vacuum();
  index.reset();
  index = loadIndex(path);
  addDocs(*index, 20, 40);
  ASSERT_GT(index->GetMetrics().Pages, 50u);
}

std::vector<std::string> sortedScan(const Index& index) {
  auto found = scan(index, "");
  std::sort(found.begin(), found.end());
  return found;
}

// The number of hot keys and of pages in the database.
std::pair<uint64_t, uint64_t> countKeys(const std::string& path) {
  const salt::Database database = salt::openDatabase(path, salt::OpenMode::existing);
  const std::unique_ptr<leveldb::Iterator> key(database.db->NewIterator({}));
  std::pair<uint64_t, uint64_t> counts;
  for (key->SeekToFirst(); key->Valid() && key->key()[0] != '\xFF'; key->Next()) {
    ++(key->key()[0] == '\0' ? counts.first : counts.second);
  }
  return counts;
}

}  // namespace

TEST(FullDisk, AnInterruptedMergeLosesNothingAndIsRepeated) {
  const TemporaryDirectory directory;
  const std::string original = directory / "original";
  makeIndex(original);
  const auto all = sortedScan(*loadIndex(original));
  const uint64_t hotBefore = loadIndex(original)->GetMetrics().HotSuffixes;
  std::set<uint64_t> hotAfter;
  bool failed = true;
  for (int64_t bytes = 0; failed; bytes += 1300) {
    const std::string path = directory / std::to_string(bytes);
    std::filesystem::copy(original, path);
    FullDiskEnv disk;
    auto index = salt::index::load(salt::openDatabase(path, salt::OpenMode::existing, &disk));
    {
      const LogCapture log;
      disk.setBytesLeft(bytes);
      index->Vacuum();
      index.reset();
      failed = log.has("error SALT: Error writing to db: IO error: No space left on device");
      EXPECT_EQ(failed, disk.bytesLeft() < 0);
    }
    const auto counted = countKeys(path);
    index = salt::index::load(salt::openDatabase(path, salt::OpenMode::existing));
    ASSERT_TRUE(index);
    const Index::Metrics metrics = index->GetMetrics();
    EXPECT_EQ(counted, std::pair(metrics.HotSuffixes, metrics.Pages)) << bytes;
    EXPECT_EQ(metrics.Suffixes, all.size());
    EXPECT_EQ(sortedScan(*index), all) << bytes;
    EXPECT_TRUE(index->Validate()) << bytes;
    hotAfter.insert(metrics.HotSuffixes);

    for (uint32_t docID = 40; index->GetMetrics().HotSuffixes < kMaxHotSuffixes / 2; ++docID) {
      addDocs(*index, docID, docID + 1);
    }
    index->Vacuum();
    index.reset();
    index = salt::index::load(salt::openDatabase(path, salt::OpenMode::existing));
    EXPECT_TRUE(index->Validate()) << bytes;
    EXPECT_EQ(index->GetMetrics().HotSuffixes, 0u) << bytes;
    const auto more = sortedScan(*index);
    EXPECT_TRUE(std::includes(more.begin(), more.end(), all.begin(), all.end())) << bytes;
  }
  EXPECT_EQ(*hotAfter.begin(), 0u);
  EXPECT_EQ(*hotAfter.rbegin(), hotBefore);
  EXPECT_GT(hotAfter.size(), 5u);
}
