#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "salt/Index.h"
#include "tests/salt/SaltSupport.h"
#include "tests/support/TemporaryDirectory.h"

using salt::Index;
using salttest::addZone;
using salttest::loadIndex;
using salttest::newIndex;
using salttest::scan;
using testsupport::TemporaryDirectory;

namespace {

Index::Options smallOptions() {
  Index::Options options;
  options.MaxHotSuffixes = 4;
  options.MaxPageSuffixes = 3;
  options.MaxShardSuffixes = 8;
  options.MaxShards = 2;
  return options;
}

// Starts a merge and waits until it has ended.
void vacuum(std::unique_ptr<Index>* index, const std::string& path) {
  (*index)->Vacuum();
  index->reset();
  *index = loadIndex(path);
  ASSERT_TRUE(*index);
}

TEST(Vacuum, MovesTheHotPartIntoOneShardAfterTheOther) {
  const TemporaryDirectory directory;
  const std::string path = directory / "index";
  Index::Options options = smallOptions();
  options.MaxHotSuffixes = 100;
  auto index = newIndex(path, options);
  const std::string text = "one two three four five";
  struct Round {
    uint64_t shards, lastShardSuffixes, lastShardVacuumed;
  };
  // 50 suffixes a round against 8 a shard: each round fills a shard, then they take turns.
  const Round rounds[] = {{1, 50, 1}, {2, 50, 2}, {2, 50, 1}, {2, 100, 2}};
  uint32_t docID = 0;
  for (const Round& round : rounds) {
    index->Vacuum();  // too little is hot
    for (int i = 0; i < 10; ++i) {
      ASSERT_TRUE(addZone(*index, ++docID, 1, text, salttest::wordOffsets(text)));
    }
    const auto before = scan(*index, "f");
    vacuum(&index, path);
    const Index::Metrics metrics = index->GetMetrics();
    EXPECT_EQ(metrics.Shards, round.shards);
    EXPECT_EQ(metrics.LastShardSuffixes, round.lastShardSuffixes);
    EXPECT_EQ(metrics.LastShardVacuumed, round.lastShardVacuumed);
    EXPECT_EQ(metrics.HotSuffixes, 0);
    EXPECT_EQ(metrics.Suffixes, docID * 5);
    EXPECT_EQ(metrics.Vacuums, docID / 10);
    EXPECT_THAT(scan(*index, "f"), testing::UnorderedElementsAreArray(before));
    EXPECT_TRUE(index->Validate());
  }
}

}  // namespace
