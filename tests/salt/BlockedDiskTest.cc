#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <condition_variable>
#include <thread>

#include "platform/Mutex.h"
#include "salt/IndexImpl.h"
#include "salt/LogSync.h"
#include "tests/salt/FaultInjectionEnv.h"
#include "tests/salt/SaltSupport.h"
#include "tests/support/TemporaryDirectory.h"

// Tests with delayed disk operations.
namespace {

using salt::Index;
using salttest::addZone;

enum class Operation { append, sync };

// Can block operations on files of one kind until they are released.
class BlockingEnv final : public salttest::FaultInjectionEnv {
 public:
  explicit BlockingEnv(std::string suffix, Operation blocks = Operation::append)
      : _suffix(std::move(suffix)), _blocks(blocks) {}

  // Blocks from the operation after so many others; a log record takes two writes.
  void blockAfter(int writes) {
    platform::MutexLock lock(_mutex);
    _blocked = true;
    _pass = writes;
  }
  void release() {
    platform::MutexLock lock(_mutex);
    _blocked = _waiting = false;
    _changed.notify_all();
  }
  // Returns when a writer is blocked.
  void waitForWriter() {
    platform::MutexLock lock(_mutex);
    while (!_waiting) _changed.wait(_mutex);
  }
  [[nodiscard]] bool hasWriter() {
    platform::MutexLock lock(_mutex);
    return _waiting;
  }

 private:
  leveldb::Status append(const std::string& path, File& file,
                         const leveldb::Slice& bytes) override {
    pass(path, Operation::append);
    return file.Append(bytes);
  }
  leveldb::Status sync(const std::string& path, File& file) override {
    pass(path, Operation::sync);
    return file.Sync();
  }
  void pass(const std::string& path, Operation operation) {
    if (operation != _blocks || !path.ends_with(_suffix)) return;
    platform::MutexLock lock(_mutex);
    if (!_blocked || _pass-- > 0) return;
    _waiting = true;
    _changed.notify_all();
    while (_blocked) _changed.wait(_mutex);
  }

  const std::string _suffix;
  const Operation _blocks;
  platform::Mutex _mutex;
  std::condition_variable_any _changed;
  bool _blocked TL_GUARDED_BY(_mutex) = false;
  bool _waiting TL_GUARDED_BY(_mutex) = false;
  int _pass TL_GUARDED_BY(_mutex) = 0;
};

std::vector<std::string> sortedScan(const Index& index) {
  std::vector<std::string> found = salttest::scan(index, "");
  std::sort(found.begin(), found.end());
  return found;
}

uint64_t countOfPlaces(const Index& index) {
  return salttest::scanPlaces(index, "a")->suffixes;
}

// A new index whose files are opened through `disk`.
std::unique_ptr<salt::index> newIndexOn(BlockingEnv* disk, const std::string& path,
                                        const Index::Options& options = {}) {
  EXPECT_NE(salttest::newIndex(path, options), nullptr);
  auto index = salt::index::load(salt::openDatabase(path, salt::OpenMode::existing, disk));
  EXPECT_NE(index, nullptr);
  return index;
}

void addDocs(Index& index, uint32_t count) {
  for (uint32_t docID = 1; docID <= count; ++docID) {
    ASSERT_TRUE(addZone(index, docID, 1, "a b", {0, 2}));
  }
}

void write(salt::BatchWriter& writer, size_t bytes) {
  leveldb::WriteBatch batch;
  batch.Put("a", std::string(bytes, 'a'));
  EXPECT_TRUE(writer.write(&batch).ok());
}

// Runs `waits`, which is released from another thread. If it did not wait, `released` would be
// false; if its end were not notified, it would take ten seconds.
template <typename Waits>
void expectWaiting(BlockingEnv* disk, const Waits& waits) {
  std::atomic<bool> begins = false;
  std::atomic<bool> released = false;
  std::thread releasing([&] {
    while (!begins) std::this_thread::yield();
    for (int i = 0; i < 1000; ++i) std::this_thread::yield();  // what does not wait ends meanwhile
    released = true;
    disk->release();
  });
  begins = true;
  waits();
  EXPECT_TRUE(released);
  releasing.join();
}

}  // namespace

// If scans waited for the write, this test would not end.
TEST(BlockedDisk, ScansBeginWhileABatchIsWrittenAndFindEachSuffixOnce) {
  constexpr uint32_t kDocs = 20;
  const testsupport::TemporaryDirectory directory;
  Index::Options options;
  options.MaxHotSuffixes = 2 * kDocs;
  options.MaxPageSuffixes = 3;
  BlockingEnv disk(".log");
  const auto index = newIndexOn(&disk, directory / "i", options);
  addDocs(*index, kDocs - 1);

  disk.blockAfter(0);
  std::thread adding([&index] { EXPECT_TRUE(addZone(*index, kDocs, 1, "a b", {0, 2})); });
  disk.waitForWriter();
  EXPECT_EQ(sortedScan(*index).size(), 2 * (kDocs - 1));
  EXPECT_EQ(countOfPlaces(*index), kDocs - 1);
  disk.release();
  adding.join();
  const auto all = sortedScan(*index);
  EXPECT_EQ(all.size(), 2 * kDocs);

  disk.blockAfter(2);  // lets the record of the merge pass, but not its pages
  index->Vacuum();
  disk.waitForWriter();
  EXPECT_EQ(sortedScan(*index), all);
  EXPECT_EQ(countOfPlaces(*index), kDocs);
  disk.release();
  while (index->GetMetrics().VacuumInProgress) std::this_thread::yield();
  EXPECT_GT(index->GetMetrics().Pages, 0u);
  EXPECT_EQ(sortedScan(*index), all);
  EXPECT_EQ(countOfPlaces(*index), kDocs);
  EXPECT_TRUE(index->Validate());
}

TEST(BlockedDisk, IngestWaitsDuringAMergeAndDuringACompaction) {
  for (const bool merges : {true, false}) {
    const testsupport::TemporaryDirectory directory;
    Index::Options options;
    if (merges) options.MaxHotSuffixes = 4;
    BlockingEnv disk(merges ? ".log" : ".ldb");
    const auto index = newIndexOn(&disk, directory / "i", options);
    index->WaitForMaintenance();  // returns at once
    addDocs(*index, 1);
    disk.blockAfter(merges ? 2 : 0);  // lets the record of a merge pass, but not its pages
    std::thread working([&] { merges ? index->Vacuum() : static_cast<void>(index->Compact()); });
    disk.waitForWriter();
    expectWaiting(&disk, [&index] { index->WaitForMaintenance(); });
    working.join();
    EXPECT_EQ(index->GetMetrics().HotSuffixes == 0, merges);
  }
}

// A merge that would run for long, in an index that nobody needs any more.
TEST(BlockedDisk, AnInterruptionEndsAMergeAndAllWaits) {
  constexpr uint32_t kDocs = 400;
  const testsupport::TemporaryDirectory directory;
  Index::Options options;
  options.MaxHotSuffixes = 2 * kDocs;
  options.MaxPageSuffixes = 2;
  options.MaxBatchBytes = 1;
  BlockingEnv disk(".log");
  auto index = newIndexOn(&disk, directory / "i", options);
  addDocs(*index, kDocs);
  disk.blockAfter(2);  // lets the record of the merge and its first pages pass
  index->Vacuum();
  disk.waitForWriter();
  std::thread compacting([&index] { EXPECT_TRUE(index->Compact()); });
  std::thread adding([&index] { index->WaitForMaintenance(); });
  index->Interrupt();
  compacting.join();
  adding.join();
  disk.release();
  index.reset();
  const auto again = salttest::loadIndex(directory / "i");
  ASSERT_NE(again, nullptr);
  EXPECT_GT(again->GetMetrics().HotSuffixes, kDocs);
  EXPECT_EQ(sortedScan(*again).size(), 2 * kDocs);
  EXPECT_TRUE(again->Validate());
}

// leveldb would end the process if it failed to write that memtable.
TEST(BlockedDisk, BatchesThatMayFillAMemtableWaitForTheEndOfACompaction) {
  const testsupport::TemporaryDirectory directory;
  BlockingEnv disk(".ldb");
  const salt::Database database =
      salt::openDatabase(directory / "i", salt::OpenMode::create, &disk);
  ASSERT_NE(database.db, nullptr);
  salt::BatchWriter writer(database);
  write(writer, 1);

  disk.blockAfter(0);
  std::thread compacting([&] { writer.compact(nullptr, nullptr); });
  disk.waitForWriter();
  write(writer, 1);
  expectWaiting(&disk, [&writer] { write(writer, 2 << 20); });
  compacting.join();
}

// The memtable of a class at rest is written to a table, unless it is small.
TEST(BlockedDisk, AnIdleWriterFlushesItsMemtable) {
  const testsupport::TemporaryDirectory directory;
  BlockingEnv disk(".ldb");
  const salt::Database database =
      salt::openDatabase(directory / "i", salt::OpenMode::create, &disk);
  ASSERT_NE(database.db, nullptr);
  disk.blockAfter(0);
  {
    salt::BatchWriter patient(database);  // its end does not wait for the idle time
    write(patient, 1 << 20);
  }
  salt::BatchWriter writer(database, std::chrono::milliseconds(0));
  write(writer, 1 << 10);
  EXPECT_FALSE(disk.hasWriter());
  write(writer, 1 << 20);
  disk.waitForWriter();
  disk.release();
}

// The background sync thread once spun while it held the lock that the other thread needed.
TEST(BlockedDisk, ASyncEndsWhileMuchMoreIsWritten) {
  const testsupport::TemporaryDirectory directory;
  const std::string much(size_t{2} << 20, 'x');
  for (int round = 0; round < 10; ++round) {
    BlockingEnv disk("", Operation::sync);
    disk.blockAfter(0);
    salt::LogSync logs(&disk);
    leveldb::WritableFile* opened = nullptr;
    const std::string path = directory / ("log" + std::to_string(round));
    ASSERT_TRUE(leveldb::Env::Default()->NewWritableFile(path, &opened).ok());
    ASSERT_TRUE(logs.follow(path, std::unique_ptr<leveldb::WritableFile>(opened), &opened).ok());
    const std::unique_ptr<leveldb::WritableFile> file(opened);
    ASSERT_TRUE(file->Append("a").ok());
    std::thread syncing([&file] { EXPECT_TRUE(file->Sync().ok()); });
    disk.waitForWriter();
    ASSERT_TRUE(file->Append(much).ok());
    ASSERT_TRUE(file->Flush().ok());
    disk.release();
    syncing.join();
    EXPECT_TRUE(file->Sync().ok());
  }
}
