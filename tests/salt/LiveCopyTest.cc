#include <gtest/gtest.h>

#include <set>

#include "salt/Inspection.h"
#include "tests/salt/Model.h"
#include "tests/salt/SaltSupport.h"
#include "tests/support/FileSizeLimit.h"
#include "tests/support/LogCapture.h"
#include "tests/support/Seed.h"
#include "tests/support/TemporaryDirectory.h"

// Copies of an index without deleted documents.
namespace {

constexpr uint32_t kSeeds = 6;
constexpr uint32_t kDocs = 60;

// A word that occurs in this document only.
std::string wordOf(uint32_t docID) {
  return "only" + std::to_string(docID) + "here";
}

class LiveCopyTest : public testing::Test {
 protected:
  // Two zones per document, some merged into shards and some hot.
  void fill(uint32_t seed) {
    std::mt19937 random(seed);
    salt::Index::Options options;
    options.MaxPageSuffixes = 1 + seed % 9;
    options.MaxShardSuffixes = 400;
    options.MaxShards = 3;
    options.MaxHotSuffixes = 300;
    options.MaxBatchBytes = 1000;
    auto index = salttest::newIndex(from, options);
    for (uint32_t docID = 1; docID <= kDocs; ++docID) {
      for (const uint16_t zoneID : {1, 300}) {
        const std::string text =
            salttest::randomText(random, 40) + ' ' + wordOf(docID) + ' ' + std::string(20, 'a');
        ASSERT_TRUE(
            salttest::addZone(*index, docID, zoneID, text, salttest::randomOffsets(random, text)));
      }
      if (docID % 15 != 0) continue;
      index->Vacuum();
      index = nullptr;  // waits for the merge
      index = salttest::loadIndex(from);
    }
    for (uint32_t docID = 1; docID <= kDocs; ++docID) {
      if (random() % (1 + seed % 4) == 0) gone.insert(docID);
    }
    const uint32_t unknown = *gone.rbegin();  // neither kept nor deleted
    for (const uint32_t docID : gone) {
      if (docID == unknown) continue;
      ASSERT_TRUE(index->DeleteDoc(docID));
    }
    isKept = [unknown](uint32_t docID) { return docID != unknown; };
  }

  std::optional<uint64_t> copy() {
    const auto inspection = salt::Inspection::capture(from, &error);
    if (inspection == nullptr || inspection->load() == nullptr) return std::nullopt;
    return inspection->copyLive(
        to, isKept, [this] { ++batches; }, &error);
  }

  // All keys and values.
  static std::string bytesOf(const std::string& path) {
    std::string all;
    for (const auto& [key, value] : salttest::readKeys(path)) all += key + '\n' + value + '\n';
    return all;
  }

  testsupport::LogCapture log;
  testsupport::TemporaryDirectory directory;
  const std::string from = directory / "from";
  const std::string to = directory / "to";
  std::set<uint32_t> gone;
  std::function<bool(uint32_t)> isKept;
  size_t batches = 0;
  std::optional<TLError> error;
};

}  // namespace

TEST_F(LiveCopyTest, GivesTheSameAnswersAndContainsNothingElse) {
  for (uint32_t seed = testsupport::firstSeed(); seed < testsupport::firstSeed() + kSeeds; ++seed) {
    SCOPED_TRACE(seed);
    gone.clear();
    fill(seed);
    ASSERT_EQ(copy(), gone.size()) << platform::printable(error);
    EXPECT_GT(batches, 0u);
    const std::string before = bytesOf(from);
    const std::string after = bytesOf(to);
    for (uint32_t docID = 1; docID <= kDocs; ++docID) {
      EXPECT_NE(before.find(wordOf(docID)), std::string::npos);
      EXPECT_EQ(after.find(wordOf(docID)) == std::string::npos, gone.contains(docID)) << docID;
    }
    EXPECT_TRUE(salttest::storedDeletions(salttest::readKeys(to)).empty());

    auto old = salttest::loadIndex(from);
    auto made = salttest::loadIndex(to);
    ASSERT_NE(made, nullptr);
    EXPECT_TRUE(old->DeleteDoc(*gone.rbegin()));
    EXPECT_TRUE(made->Validate());
    std::mt19937 random(seed);
    std::vector<std::string> prefixes{"", "a", "only", "o", "aaaaaaaa "};
    for (int i = 0; i < 200; ++i) prefixes.push_back(salttest::randomText(random, 1 + i % 4));
    for (const std::string& prefix : prefixes) {
      EXPECT_EQ(salttest::scan(*made, prefix), salttest::scan(*old, prefix)) << prefix;
    }
    const auto metrics = made->GetMetrics();
    EXPECT_EQ(metrics.Suffixes, salttest::scan(*made, "").size());
    EXPECT_EQ(metrics.Docs, kDocs - gone.size());
    EXPECT_EQ(metrics.DeletedDocs, 0u);
    EXPECT_EQ(metrics.MaxDocID, kDocs);
    EXPECT_GE(metrics.Shards, 2u);
    EXPECT_EQ(metrics.Shards, old->GetMetrics().Shards);
    const auto page = made->GetOptions().MaxPageSuffixes;
    EXPECT_LE(metrics.Pages,
              2 * (metrics.Suffixes - metrics.HotSuffixes) / page + 2 * metrics.Shards);

    // The copy accepts documents and merges like any other index.
    for (uint32_t docID = kDocs + 1; docID < kDocs + 30; ++docID) {
      const std::string text = wordOf(docID) + ' ' + salttest::randomText(random, 200);
      ASSERT_TRUE(salttest::addZone(*made, docID, 1, text));
    }
    made->Vacuum();
    EXPECT_TRUE(made->Compact());
    EXPECT_TRUE(made->Validate());
    EXPECT_FALSE(log.contains("# of suffixes"));
    EXPECT_EQ(salttest::scan(*made, wordOf(kDocs + 1)).size(), 1u);
  }
}

TEST_F(LiveCopyTest, AWriteThatFailsIsAnError) {
  gone.clear();
  fill(3);
  for (const uint64_t bytes : {0, 100, 4000, 20000}) {
    const testsupport::FileSizeLimit limit(bytes);
    EXPECT_EQ(copy(), std::nullopt) << bytes;
    ASSERT_TRUE(error) << bytes;
    EXPECT_EQ(error->domain, kPOSIXErrorDomain);
    error.reset();
  }
  EXPECT_EQ(copy(), gone.size());
}
