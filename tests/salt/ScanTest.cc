#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <thread>

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

namespace {

Index::Options matchLengths(uint8_t least, uint8_t most) {
  Index::Options options;
  options.MinMatchLen = least;
  options.MaxMatchLen = most;
  return options;
}

}  // namespace

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

TEST(ScanPrefix, RunsConcurrentlyWithAddZone) {
  const TemporaryDirectory directory;
  const auto index = newIndex(directory / "i");
  std::atomic<uint32_t> added{0};
  std::jthread writer([&] {
    for (uint32_t docID = 1; docID <= 300; ++docID) {
      EXPECT_TRUE(addZone(*index, docID, 1, "some words", {0, 5}));
      added = docID;
    }
  });
  for (bool done = false; !done;) {
    done = added == 300;
    const uint32_t before = added;
    const size_t found = scan(*index, "some").size();
    EXPECT_GE(found, before);
    EXPECT_LE(found, index->GetMetrics().Docs);
  }
}

TEST(Suffix, DerivesTheNextFromThePageEntry) {
  const TemporaryDirectory directory;
  const auto owner = newIndex(directory / "i", matchLengths(2, 5));
  ASSERT_TRUE(addZone(*owner, 1, 1, "abcdefg", {}));
  const auto& index = dynamic_cast<const salt::index&>(*owner);
  const struct {
    SuffixMeta meta;
    std::string known;
    bool full;
  } cases[] = {
      {{1, 0, 1, 3, {'x', 'y'}}, "abcxy", false},  // may be longer
      {{1, 0, 1, 3, {'x', 0}}, "abcx", true},
      {{1, 0, 1, 3, {0, 0}}, "abc", true},
      {{1, 0, 1, 0, {0, 0}}, "", false},  // nothing is known, so it is fetched
  };
  for (const auto& c : cases) {
    salt::Suffix suffix(index, {});
    EXPECT_TRUE(suffix.full && suffix.knownText().empty());
    suffix.fromKey(
        "\x01"
        "abcd\0\x01\0\x01"s);
    suffix.fromNextMeta(c.meta);
    EXPECT_EQ(suffix.knownText(), c.known);
    EXPECT_EQ(suffix.full, c.full);
  }
  salt::Suffix suffix(index, {});
  suffix.fromKey(
      "\x01"
      "abcde\0\x01\0\x01"s);
  suffix.fromNextMeta({1, 0, 1, 1, {'b', 'c'}});
  suffix.fromNextMeta({1, 0, 1, 4, {'e', 0}});  // longer common prefix than the known text: ignored
  EXPECT_EQ(suffix.knownText(), "abc");
  EXPECT_FALSE(suffix.full);
  suffix.fetch();
  suffix.fetch();
  EXPECT_EQ(suffix.knownText(), "abcde");
  EXPECT_EQ(suffix.fetches, 1u);
  salt::Suffix copy(index, {});
  copy = suffix;
  EXPECT_EQ(copy.knownText(), "abcde");
  EXPECT_EQ(copy.fetches, 0u);
  EXPECT_EQ(copy.meta.DocID, 1u);
}

TEST(Suffix, CorruptDataEndsTheProcess) {
  const TemporaryDirectory directory;
  const auto owner = newIndex(directory / "i", matchLengths(2, 5));
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
