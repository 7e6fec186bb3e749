#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <thread>

#include "salt/Index.h"
#include "tests/salt/Model.h"
#include "tests/salt/SaltSupport.h"
#include "tests/support/FileSizeLimit.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TemporaryDirectory.h"

using salt::Index;
using salttest::addZone;
using salttest::loadIndex;
using salttest::newIndex;
using testsupport::TemporaryDirectory;

namespace {

const std::string kText = "one two three four five";
const std::vector<uint32_t> kOffsets = salttest::wordOffsets(kText);

Index::Options smallOptions(uint32_t hotSuffixes) {
  Index::Options options;
  options.MaxHotSuffixes = hotSuffixes;
  options.MaxPageSuffixes = 3;
  options.MaxShardSuffixes = 8;
  options.MaxShards = 2;
  options.MaxBatchBytes = 1;
  return options;
}

// Adds documents of five suffixes.
void addDocs(Index& index, uint32_t from, uint32_t to) {
  for (uint32_t docID = from; docID <= to; ++docID) {
    ASSERT_TRUE(addZone(index, docID, 1, kText, kOffsets));
  }
}

void vacuum(Index& index) {
  index.Vacuum();
  while (index.GetMetrics().VacuumInProgress) std::this_thread::yield();
}

// Compares the keys of a closed index with the model after `docs` documents.
std::string faultOf(const std::string& path, const Index::Options& options, uint32_t docs) {
  salttest::Model model(options);
  for (uint32_t docID = 1; docID <= docs; ++docID) model.addZone(docID, 1, kText, kOffsets, true);
  return difference(salttest::readKeys(path), &model);
}

TEST(Vacuum, CachedScansDecideWhetherALimitHolds) {
  const TemporaryDirectory directory;
  const auto index = newIndex(directory / "index", smallOptions(100));
  addDocs(*index, 1, 10);
  vacuum(*index);
  ASSERT_EQ(index->GetMetrics().HotSuffixes, 0u);
  const auto places = [&index](uint64_t limit) -> std::optional<size_t> {
    const auto found = salttest::scanPlaces(*index, "two", limit);
    if (!found) return std::nullopt;
    EXPECT_EQ(found->places.size(), found->suffixes) << limit;
    return found->suffixes;
  };
  EXPECT_EQ(places(49), std::nullopt);  // of 50 suffixes
  EXPECT_EQ(places(50), 10u);
  EXPECT_EQ(places(10), 10u);
  EXPECT_EQ(places(9), std::nullopt);
  addDocs(*index, 11, 11);
  EXPECT_EQ(places(14), std::nullopt);  // all 5 hot suffixes might match
  EXPECT_EQ(places(15), 11u);
}

TEST(Vacuum, MergesTheHotPartIntoTheShardsInTurn) {
  const TemporaryDirectory directory;
  auto index = newIndex(directory / "index", smallOptions(100));
  struct Round {
    uint64_t shards, lastShardSuffixes, lastShardVacuumed;
  };
  // 50 suffixes per round and 8 per shard: each round fills a shard; then shards take turns.
  const Round rounds[] = {{1, 50, 1}, {2, 50, 2}, {2, 50, 1}, {2, 100, 2}};
  uint64_t vacuums = 0;
  uint32_t docID = 1;
  for (const Round& round : rounds) {
    addDocs(*index, docID, docID + 8);
    index->Vacuum();  // 45 are less than half of MaxHotSuffixes
    EXPECT_EQ(index->GetMetrics().HotSuffixes, 45u);
    addDocs(*index, docID + 9, docID + 9);
    ASSERT_TRUE(index->DeleteDoc(docID));  // merged like any other
    docID += 10;
    index->Vacuum();
    index.reset();  // waits for the merge
    index = loadIndex(directory / "index");
    const Index::Metrics metrics = index->GetMetrics();
    EXPECT_EQ(metrics.Shards, round.shards);
    EXPECT_EQ(metrics.LastShardSuffixes, round.lastShardSuffixes);
    EXPECT_EQ(metrics.LastShardVacuumed, round.lastShardVacuumed);
    EXPECT_EQ(metrics.HotSuffixes, 0u);
    EXPECT_EQ(metrics.Vacuums, ++vacuums);
  }
}

// Each scan finds everything added before it exactly once, wherever the merges have it at the
// moment.
TEST(Vacuum, ScansAndAddsRunDuringMerges) {
  constexpr uint32_t kDocs = 100;
  constexpr uint64_t kVacuums = 4;
  const TemporaryDirectory directory;
  auto index = newIndex(directory / "index", smallOptions(40));
  std::atomic<uint32_t> added{0};
  {
    std::atomic<bool> ended{false};
    const auto scanner = [&] {
      for (bool last = false; !last;) {
        last = ended;
        const uint32_t before = added;
        auto found = salttest::scan(*index, "t");  // two per document
        std::sort(found.begin(), found.end());
        EXPECT_EQ(std::adjacent_find(found.begin(), found.end()), found.end());
        EXPECT_GE(found.size(), 2 * before);
        EXPECT_LE(found.size(), 2 * (added + 1));
        index->Vacuum();
      }
    };
    std::jthread first(scanner);
    std::jthread second(scanner);
    while (added < kDocs || index->GetMetrics().Vacuums < kVacuums) {
      addDocs(*index, added + 1, added + 1);
      ++added;
    }
    ended = true;
  }
  EXPECT_TRUE(index->Validate());
  index.reset();
  EXPECT_EQ(faultOf(directory / "index", smallOptions(40), added), "");
}

// The merge is long enough to give way more than once.
TEST(Vacuum, EndsWhileAScanGoesOn) {
  constexpr uint32_t kDocs = 4000;
  const TemporaryDirectory directory;
  const auto index = newIndex(directory / "index", smallOptions(5 * kDocs));
  addDocs(*index, 1, kDocs);
  bool vacuumed = false;
  index->ScanPrefix("two", [&](const auto&) {
    vacuum(*index);
    vacuumed = true;
    return false;
  });
  EXPECT_TRUE(vacuumed);
  EXPECT_EQ(index->GetMetrics().HotSuffixes, 0u);
}

// During the first batch of a merge or a later one, into a new shard or one with pages.
TEST(Vacuum, AFailedWriteEndsAMergeAndLosesNothing) {
  for (const uint64_t room : {400u, 3000u, 400u + 1, 3000u + 1}) {
    const TemporaryDirectory directory;
    const std::string path = directory / "index";
    auto index = newIndex(path, smallOptions(300));
    const uint32_t docs = room % 2 == 1 ? 60 : 30;
    addDocs(*index, 1, 30);
    if (docs > 30) vacuum(*index);
    addDocs(*index, 31, docs);
    index.reset();  // includes its background work, such as a new log
    index = loadIndex(path);
    ASSERT_TRUE(index);
    {
      const testsupport::LogCapture log;
      const testsupport::FileSizeLimit limit(std::filesystem::file_size(salttest::newestLog(path)) +
                                             room);
      vacuum(*index);
      EXPECT_EQ(log.count("error SALT: Error writing to db: "), 1u);
    }
    const uint64_t hot = index->GetMetrics().HotSuffixes;
    EXPECT_EQ(hot == 150, room < 3000) << hot;
    EXPECT_GT(hot, 0u);
    addDocs(*index, docs + 1, docs + 30);
    index.reset();
    EXPECT_EQ(faultOf(path, smallOptions(300), docs + 30), "");
  }
}

}  // namespace

// A merge of a large hot part would otherwise wait for more.
TEST(Vacuum, ARequestedMergeBeginsAtOnceAndIsFollowedByCompaction) {
  const TemporaryDirectory directory;
  Index::Options options;
  options.MaxHotSuffixes = 100000;
  const auto index = newIndex(directory / "i", options);
  std::string text;
  for (int word = 0; word < 10000; ++word) text += std::to_string(10000 + word) + ' ';
  for (uint32_t docID = 1; docID <= 6; ++docID) {
    ASSERT_TRUE(addZone(*index, docID, 1, text, salttest::wordOffsets(text)));
  }
  index->Vacuum();
  EXPECT_TRUE(index->Compact());
  const Index::Metrics metrics = index->GetMetrics();
  EXPECT_EQ(metrics.Vacuums, 1u);
  EXPECT_EQ(metrics.HotSuffixes, 0u);
}
