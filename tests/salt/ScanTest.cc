#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "salt/IndexImpl.h"
#include "salt/Suffix.h"
#include "tests/salt/SaltSupport.h"
#include "tests/support/TemporaryDirectory.h"

using salt::Index;
using salt::SuffixMeta;
using salttest::addZone;
using salttest::loadIndex;
using salttest::newIndex;
using salttest::scan;
using testing::ElementsAre;
using testsupport::TemporaryDirectory;
using namespace std::string_literals;

TEST(ScanPrefix, StopsWhenToldAndCountsWhatItDid) {
  const TemporaryDirectory directory;
  auto index = newIndex(directory / "i");
  ASSERT_TRUE(addZone(*index, 1, 1, "alpha beta gamma", {0, 6}));
  ASSERT_TRUE(addZone(*index, 2, 1, "alpha beta delta", {}));
  index.reset();
  // The page has only 12 bytes of the second suffix.
  salttest::writePage(directory / "i", 1, "alpha beta delta",
                      {{2, 0, 1, 0, {}}, {1, 0, 1, 11, {'g', 'a'}}});
  index = loadIndex(directory / "i");
  ASSERT_TRUE(index);
  EXPECT_THAT(scan(*index, "alpha beta "), ElementsAre("1,1:0", "2,1:0", "1,1:0"));
  Index::Metrics m = index->GetMetrics();
  EXPECT_EQ(m.Scans, 1u);
  EXPECT_EQ(m.ScanResults, 3u);
  EXPECT_EQ(m.ScanHotReads, 2u);
  EXPECT_EQ(m.ScanPageReads, 1u);
  EXPECT_EQ(m.ScanTextFetches, 0u);
  EXPECT_GT(m.ScanSeconds, 0);
  EXPECT_THAT(scan(*index, "alpha beta gamma"), ElementsAre("1,1:0", "1,1:0"));
  EXPECT_EQ(index->GetMetrics().ScanTextFetches, 1u);
  int calls = 0;
  EXPECT_TRUE(index->ScanPrefix("alpha", [&calls](const SuffixMeta&) { return ++calls < 2; }));
  EXPECT_EQ(calls, 2);
  index->ResetScanMetrics();
  m = index->GetMetrics();
  EXPECT_EQ(m.Scans + m.ScanResults + m.ScanHotReads + m.ScanPageReads + m.ScanTextFetches, 0u);
  EXPECT_EQ(m.ScanSeconds, 0);
  EXPECT_THROW(index->ScanPrefix("alpha", {}), std::bad_function_call);
  EXPECT_TRUE(index->ScanPrefix("missing", {}));
}

// A new shard without pages, and a first byte that occurs only in the neighbours of a shard.
TEST(ScanPrefix, SkipsShardsWithoutPages) {
  const TemporaryDirectory directory;
  auto index = newIndex(directory / "i");
  ASSERT_TRUE(addZone(*index, 1, 1, "word", {}));
  index.reset();
  salttest::writePage(directory / "i", 2, "word", {{1, 0, 1, 0, {}}});
  salttest::editMetrics(directory / "i", [](auto& m) { m.Shards = 4; });
  index = loadIndex(directory / "i");
  ASSERT_TRUE(index);
  for (const auto* prefix : {"", "wo", "word"}) {
    EXPECT_THAT(scan(*index, prefix), ElementsAre("1,1:0")) << prefix;
  }
  EXPECT_THAT(scan(*index, "wz"), ElementsAre());
}

TEST(Suffix, CorruptDataEndsTheProcess) {
  const TemporaryDirectory directory;
  Index::Options options;
  options.MinMatchLen = 2;
  options.MaxMatchLen = 5;
  const auto owner = newIndex(directory / "i", options);
  const auto& index = dynamic_cast<const salt::index&>(*owner);
  salt::Suffix suffix(index, {});
  EXPECT_DEATH(suffix.fromKey("\0ab"s), "s\\.size\\(\\)");
  EXPECT_DEATH(suffix.fromKey("\0ab\0\1\1\1x"s), "key\\.size\\(\\) == 0");
  EXPECT_DEATH(suffix.fromKey("\0abcdef\0\1\1\1"s), "size <= idx\\.op\\.MaxMatchLen");
  suffix.fromKey("\0abcd\0\1\1\1"s);
  EXPECT_DEATH(suffix.fromNextMeta({1, 0, 1, 5, {}}), "full && meta\\.lcp > size");
  EXPECT_DEATH(suffix.fromNextMeta({1, 0, 1, 4, {'a', 'b'}}), "size <= idx\\.op\\.MaxMatchLen");
  suffix.fromNextMeta({1, 0, 1, 0, {'a', 'b'}});  // its zone is absent
  EXPECT_DEATH(suffix.fetch(), "size\\(\\) >= size");
}
