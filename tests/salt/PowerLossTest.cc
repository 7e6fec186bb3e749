#include <gtest/gtest.h>

#include <atomic>
#include <filesystem>
#include <map>
#include <random>

#include "platform/Mutex.h"
#include "salt/IndexImpl.h"
#include "tests/salt/FaultInjectionEnv.h"
#include "tests/salt/SaltSupport.h"
#include "tests/support/TemporaryDirectory.h"

// Power losses while leveldb writes tables and removes what they replace.
namespace {

using salt::Index;

// Tracks how much of each file is certainly on disk, and takes snapshots of the directory as a
// power loss would leave it: whenever a file is removed or a manifest grows. A manifest reaches the
// disk as early as possible, a table only when it is synced. Of a log the snapshot has the synced
// part, all of it, or any part in between, independently of other logs.
class PowerLossEnv final : public salttest::FaultInjectionEnv {
 public:
  struct Snapshot {
    std::string path;
    uint32_t acknowledged = 0;  // value set by the test by then
    enum class Logs { whole, synced, cut } logs;
  };

  explicit PowerLossEnv(std::string snapshots) : _directory(std::move(snapshots)) {}

  std::atomic<uint32_t> acknowledged{0};

  [[nodiscard]] std::vector<Snapshot> snapshots() {
    platform::MutexLock lock(_mutex);
    return _snapshots;
  }

  leveldb::Status RemoveFile(const std::string& path) override {
    const leveldb::Status status = target()->RemoveFile(path);
    platform::MutexLock lock(_mutex);
    if (_synced.erase(path) != 0) takeSnapshot();
    return status;
  }
  leveldb::Status RenameFile(const std::string& from, const std::string& to) override {
    platform::MutexLock lock(_mutex);
    _synced[to] = _synced[from];
    _synced.erase(from);
    return target()->RenameFile(from, to);
  }

 private:
  void opened(const std::string& path) override {
    platform::MutexLock lock(_mutex);
    _synced.emplace(path, 0);
  }
  leveldb::Status flush(const std::string& path, File& file) override {
    const leveldb::Status status = file.Flush();
    if (path.find("MANIFEST") == std::string::npos) return status;
    platform::MutexLock lock(_mutex);
    _synced[path] = std::filesystem::file_size(path);
    takeSnapshot();
    return status;
  }
  leveldb::Status sync(const std::string& path, File& file) override {
    if (const leveldb::Status flushed = file.Flush(); !flushed.ok()) return flushed;
    std::error_code gone;  // an obsolete log may have been removed
    const uint64_t written = std::filesystem::file_size(path, gone);
    const leveldb::Status status = file.Sync();
    platform::MutexLock lock(_mutex);
    const auto known = _synced.find(path);
    if (!gone && known != _synced.end()) known->second = std::max(known->second, written);
    return status;
  }

  void takeSnapshot() TL_REQUIRES(_mutex) {
    const std::string number = std::to_string(_snapshots.size());
    const Snapshot snapshot{_directory + '/' + number, acknowledged,
                            static_cast<Snapshot::Logs>(_snapshots.size() % 3)};
    std::filesystem::create_directories(snapshot.path);
    for (const auto& [path, synced] : _synced) {
      const std::filesystem::path file = path;
      const auto copy = std::filesystem::path(snapshot.path) / file.filename();
      if (file.extension() == ".ldb" && synced != 0) {
        std::filesystem::create_hard_link(file, copy);  // immutable
        continue;
      }
      std::filesystem::copy_file(file, copy);
      const uint64_t size = std::filesystem::file_size(copy);
      uint64_t left = synced;
      if (file.extension() == ".log" && snapshot.logs == Snapshot::Logs::whole) left = size;
      if (file.extension() == ".log" && snapshot.logs == Snapshot::Logs::cut && size > synced) {
        left += _random() % 2 == 0 ? size - synced : _random() % (size - synced);
      }
      std::filesystem::resize_file(copy, std::min(left, size));
    }
    _snapshots.push_back(snapshot);
  }

  const std::string _directory;
  platform::Mutex _mutex;
  std::map<std::string, uint64_t> _synced TL_GUARDED_BY(_mutex);  // synced bytes by path
  std::vector<Snapshot> _snapshots TL_GUARDED_BY(_mutex);
  std::mt19937 _random TL_GUARDED_BY(_mutex){7};
};

constexpr uint32_t kWords = 1000;  // per document

void addDocs(Index& index, PowerLossEnv& disk, uint32_t count) {
  std::mt19937 random(5);
  for (uint32_t docID = 1; docID <= count; ++docID) {
    std::string text;
    while (text.size() < kWords * 5) text += std::to_string(random() % 9000 + 1000) + ' ';
    ASSERT_TRUE(salttest::addZone(index, docID, 1, text, salttest::wordOffsets(text)));
    disk.acknowledged = docID;
  }
}

TEST(PowerLoss, LeavesTheFirstOperationsWithoutAGap) {
  const testsupport::TemporaryDirectory directory;
  PowerLossEnv disk(directory / "snapshots");
  const std::string path = directory / "index";
  Index::Options options;
  options.MaxHotSuffixes = 50000;
  salttest::newIndex(path, options).reset();
  auto index = salt::index::load(salt::openDatabase(path, salt::OpenMode::existing, &disk));
  ASSERT_TRUE(index);
  addDocs(*index, disk, 400);
  index.reset();

  uint32_t before = 0;
  size_t opened = 0;
  for (const PowerLossEnv::Snapshot& snapshot : disk.snapshots()) {
    if (!std::filesystem::exists(snapshot.path + "/CURRENT")) continue;
    const auto found = salttest::loadIndex(snapshot.path);
    ASSERT_TRUE(found) << snapshot.path;
    const Index::Metrics metrics = found->GetMetrics();
    EXPECT_TRUE(found->Validate()) << snapshot.path;
    EXPECT_EQ(metrics.Docs, metrics.MaxDocID);
    EXPECT_EQ(metrics.Suffixes, uint64_t{metrics.MaxDocID} * kWords);
    EXPECT_GE(metrics.MaxDocID, before) << snapshot.path;
    if (snapshot.logs == PowerLossEnv::Snapshot::Logs::synced) before = metrics.MaxDocID;
    if (snapshot.logs == PowerLossEnv::Snapshot::Logs::whole) {
      EXPECT_GE(metrics.MaxDocID, snapshot.acknowledged) << snapshot.path;
    }
    ++opened;
  }
  EXPECT_GT(opened, 4u);
  EXPECT_GT(before, 0u);
}

// A killed process leaves a table that no manifest lists, and its number is assigned again.
TEST(OrderedSyncEnvTest, ARemovalThatWaitsDoesNotTakeANewFileOfTheSameName) {
  const testsupport::TemporaryDirectory directory;
  const std::string path = directory / "000053.ldb";
  salt::OrderedSyncEnv files(directory / "", leveldb::Env::Default());
  for (int i = 0; i < 2000; ++i) ASSERT_TRUE(files.RemoveFile(path).ok());
  leveldb::WritableFile* file = nullptr;
  ASSERT_TRUE(files.NewWritableFile(path, &file).ok());
  const std::unique_ptr<leveldb::WritableFile> table(file);
  files.waitForDisk();
  EXPECT_TRUE(files.FileExists(path));
}

}  // namespace
