#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <numeric>

#include "salt/Index.h"
#include "tests/salt/SaltSupport.h"
#include "tests/support/FileSizeLimit.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TemporaryDirectory.h"

using salt::Index;
using salt::SuffixMeta;
using salttest::addZone;
using salttest::loadIndex;
using salttest::newIndex;
using salttest::scan;
using testing::ElementsAre;
using testsupport::LogCapture;
using testsupport::TemporaryDirectory;
using namespace std::string_literals;

TEST(AddZone, RefusesInvalidInputWithALogLine) {
  const TemporaryDirectory directory;
  Index::Options options;
  options.MaxZoneSize = 20;
  const auto index = newIndex(directory / "i", options);
  ASSERT_TRUE(addZone(*index, 1, 1, "stored text"));
  ASSERT_TRUE(index->DeleteDoc(9));
  const Index::Metrics before = index->GetMetrics();
  const struct {
    uint32_t docID;
    uint16_t zoneID;
    std::string text;
    std::vector<uint32_t> offsets;
    bool merge;
    std::string line;
  } cases[] = {
      {0, 0, "a", {0}, true, "Invalid DocID."},
      {2, 0, "a", {0}, true, "Invalid ZoneID."},
      {2, 1, std::string(21, 'x'), {3, 2}, true, "Zone text too large."},
      {2, 1, "abcd", {0, 2, 1}, true, "Offsets out of order."},
      {2, 1, "abcd", {1, 1}, true, "Offsets out of order."},
      {2, 1, "abcd", {4}, true, "Token offset out of bounds."},
      {2, 1, "", {0}, true, "Token offset out of bounds."},
      {2, 1, "ab\0d"s, {2}, true, "Empty token."},
      {9, 1, "a", {0}, true, "Doc is deleted."},
      {1, 1, "stored text", {0}, false, "Zone already exists."},
      {1, 1, "newer text", {0}, true, "Zone text too large."},
  };
  for (const auto& c : cases) {
    const LogCapture log;
    std::vector<uint32_t> offsets = c.offsets;
    EXPECT_FALSE(index->AddZone(c.docID, c.zoneID, c.text, offsets, c.merge)) << c.line;
    EXPECT_THAT(log.lines(), ElementsAre("error SALT: " + c.line));
  }
  EXPECT_FALSE(index->DeleteDoc(0));
  EXPECT_FALSE(index->DeleteDocs({1, 0}));
  const LogCapture log;
  EXPECT_TRUE(addZone(*index, 1, 1, "stored text"));
  EXPECT_THAT(log.lines(), ElementsAre("debug SALT: Ignoring duplicate text."));
  const Index::Metrics after = index->GetMetrics();
  EXPECT_EQ(after.Suffixes, before.Suffixes);
  EXPECT_EQ(after.IndexingCalls, 1u);
  EXPECT_EQ(after.Zones, 1u);
  EXPECT_EQ(after.DeletedDocs, 1u);
}

TEST(AddZone, DelaysOnlyFromTwiceTheHotLimit) {
  const TemporaryDirectory directory;
  Index::Options options;
  options.MaxHotSuffixes = 10;
  options.MaxPageSuffixes = 0;  // disables merges
  options.ThrottleFactor = 1;
  const auto index = newIndex(directory / "i", options);
  const std::string text(19, 'a');
  std::vector<uint32_t> offsets(19);
  std::iota(offsets.begin(), offsets.end(), 0);
  ASSERT_TRUE(addZone(*index, 1, 1, text, offsets));
  EXPECT_GT(index->GetMetrics().IndexingSeconds, 0);
  EXPECT_EQ(index->GetMetrics().ThrottlingSeconds, 0);
  ASSERT_TRUE(addZone(*index, 2, 1, "a"));
  const double once = index->GetMetrics().ThrottlingSeconds;
  EXPECT_GT(once, 0);
  ASSERT_TRUE(addZone(*index, 3, 1, "a"));
  EXPECT_GT(index->GetMetrics().ThrottlingSeconds, once);
}

TEST(Writes, FailOnAFullDisk) {
  const TemporaryDirectory directory;
  const auto index = newIndex(directory / "i");
  ASSERT_TRUE(addZone(*index, 1, 1, "first"));
  const auto log = salttest::newestLog(directory / "i");
  const testsupport::FileSizeLimit limit(std::filesystem::file_size(log) + 10);
  EXPECT_FALSE(index->DeleteDoc(1));
  EXPECT_FALSE(addZone(*index, 2, 1, std::string(5000, 'z')));
  EXPECT_EQ(index->GetMetrics().DeletedDocs, 0u);
  EXPECT_EQ(index->GetMetrics().MaxDocID, 1u);
}

TEST(ForEachZone, VisitsTextsInKeyOrderUntilToldToStop) {
  const TemporaryDirectory directory;
  const auto index = newIndex(directory / "i");
  for (const uint32_t docID : {9u, 10u, 4294967295u, 3u}) {
    ASSERT_TRUE(addZone(*index, docID, 12, "b" + std::to_string(docID)));
    ASSERT_TRUE(addZone(*index, docID, 2, "a" + std::to_string(docID)));
  }
  ASSERT_TRUE(index->DeleteDoc(3));
  std::vector<std::string> seen;
  const auto visit = [&seen](uint32_t docID, uint16_t zoneID, std::string_view text) {
    seen.push_back(std::to_string(docID) + "," + std::to_string(zoneID) + "=" + std::string(text));
    return seen.size() != 6;
  };
  index->ForEachZone(visit);
  EXPECT_THAT(seen, ElementsAre("10,12=b10", "10,2=a10", "4294967295,12=b4294967295",
                                "4294967295,2=a4294967295", "9,12=b9", "9,2=a9"));
  seen.assign(5, "");
  index->ForEachZone(visit);
  EXPECT_EQ(seen.size(), 6u);
  EXPECT_EQ(index->GetSuffixText({9, 1, 2, 0, {}}), "9");
  EXPECT_EQ(index->GetSuffixText({9, 2, 2, 0, {}}), "");  // beyond the text, or without one
  EXPECT_EQ(index->GetSuffixText({9, 0, 3, 0, {}}), "");
}

TEST(Compact, FilesKeptByALongReadAreRemovedWhenItEnds) {
  const TemporaryDirectory directory;
  const auto tablesLeft = [&directory](const char* name, bool reading) {
    auto index = newIndex(directory / name);
    EXPECT_TRUE(addZone(*index, 1, 1, "one text"));
    index->Compact();
    EXPECT_TRUE(addZone(*index, 2, 1, "another text"));
    if (reading) {
      index->ForEachZone([&index](auto...) {
        index->Compact();
        return false;
      });
    } else {
      index->Compact();
    }
    index.reset();
    return salttest::filesOf(directory / name, ".ldb").size();
  };
  EXPECT_EQ(tablesLeft("read", true), tablesLeft("not read", false));
}

TEST(Open, NewIndexWipesAndOptionsComeFromTheDatabase) {
  const TemporaryDirectory directory;
  Index::Options options;
  options.MaxZoneSize = 77;
  ASSERT_TRUE(addZone(*newIndex(directory / "i"), 1, 1, "old"));
  newIndex(directory / "i", options).reset();
  const auto index = loadIndex(directory / "i");
  ASSERT_TRUE(index);
  EXPECT_EQ(index->GetOptions().MaxZoneSize, 77u);
  EXPECT_EQ(index->GetOptions().Path, directory / "i");
  EXPECT_THAT(scan(*index, ""), ElementsAre());
  EXPECT_TRUE(index->Sync());
  index->Compact();
}

TEST(Open, EachFailureIsLogged) {
  const std::string version = "error SALT: Loading failure: Mismatched code version.";
  const std::string corrupted = "fault SALT: Loading failure: Metrics corrupted.";
  const struct {
    std::function<void(Index::Metrics&)> edit;
    std::string line;
  } cases[] = {
      {[](auto& m) { m.CodeVersion = 303; }, version},
      {[](auto& m) { m.Shards = 17; }, corrupted},
      {[](auto& m) { m.Shards = 16; }, ""},
      {[](auto& m) { m.TextBytes = 1; }, corrupted},
      {[](auto& m) { m.HotSuffixes = m.Suffixes + 1; }, corrupted},
      {[](auto& m) { m.Suffixes = m.HotSuffixes + 51, m.Pages = 1; }, corrupted},
      {[](auto& m) { m.Suffixes = m.HotSuffixes + 50, m.Pages = 1; }, ""},
      {[](auto& m) { m.Zones = UINT64_MAX, m.TextBytes = UINT64_MAX; }, ""},
      {[](auto& m) { m.VacuumInProgress = true; }, ""},  // after a crash
  };
  for (const auto& c : cases) {
    const TemporaryDirectory directory;
    ASSERT_TRUE(addZone(*newIndex(directory / "i"), 1, 1, "text"));
    salttest::editMetrics(directory / "i", c.edit);
    const LogCapture log;
    const auto index = loadIndex(directory / "i");
    EXPECT_EQ(index == nullptr, !c.line.empty()) << c.line;
    EXPECT_TRUE(c.line.empty() || log.has(c.line)) << c.line;
    EXPECT_FALSE(index != nullptr && index->GetMetrics().VacuumInProgress);
  }
}

TEST(Open, FailsWithoutADatabaseOrWithoutItsRecords) {
  const TemporaryDirectory directory;
  const LogCapture log;
  EXPECT_FALSE(loadIndex(directory / "none"));
  EXPECT_TRUE(log.contains("error SALT: Error opening db: Invalid argument"));
  newIndex(directory / "i").reset();
  EXPECT_TRUE(log.contains("debug LevelDB: "));
  const std::string shortMetrics(199, '\0');
  for (const std::string* value : {&shortMetrics, static_cast<const std::string*>(nullptr)}) {
    salttest::editKey(directory / "i", "\xFFMETRICS", value);
    EXPECT_FALSE(loadIndex(directory / "i"));
  }
  EXPECT_EQ(log.count("error SALT: Loading failure: Mismatched code version."), 2u);
  newIndex(directory / "i").reset();
  salttest::editKey(directory / "i", "\xFFOPTIONS", nullptr);
  EXPECT_DEATH(static_cast<void>(loadIndex(directory / "i")), "status\\.ok\\(\\)");
}

// An index written by the first release of this format: three documents merged into a page, one hot
// suffix, and one document deleted.
TEST(Open, ReadsTheKeptIndexOfItsVersion) {
  const TemporaryDirectory directory;
  std::filesystem::copy(SALT_TEST_DATA "/v304", directory / "i");
  const auto index = loadIndex(directory / "i");
  ASSERT_TRUE(index);
  EXPECT_TRUE(index->Validate());
  EXPECT_THAT(scan(*index, ""),
              ElementsAre("300,200:0", "300,12:0", "1,12:0", "300,12:6", "1,12:6", "1,12:11"));
  EXPECT_THAT(scan(*index, "alpha beta gam"), ElementsAre("1,12:0"));
  const Index::Metrics m = index->GetMetrics();
  EXPECT_EQ(m.Docs, 2u);
  EXPECT_EQ(m.DeletedDocs, 1u);
  EXPECT_EQ(m.Suffixes, 8u);
  EXPECT_EQ(m.HotSuffixes, 1u);
  EXPECT_EQ(m.Pages, 1u);
}

namespace {

// An index with one zone of 8 words, and in shard 1 one page with the given suffixes of it.
std::unique_ptr<Index> withPage(const std::string& path, const std::vector<SuffixMeta>& metas,
                                bool validateOnLoad = false) {
  Index::Options options;
  options.ValidateOnLoad = validateOnLoad;
  auto index = newIndex(path, options);
  EXPECT_TRUE(addZone(*index, 1, 1, "aa ab ba abcd", {}));
  const std::string first = index->GetSuffixText(metas.front());
  index.reset();
  salttest::writePage(path, 1, first, metas);
  return loadIndex(path);
}

}  // namespace

TEST(Validate, FindsEachFault) {
  // Suffixes at 0 "aa ab ba abcd", 3 "ab ba abcd", 9 "abcd", 6 "ba abcd".
  const SuffixMeta aa{1, 0, 1, 77, {7, 7}};
  const SuffixMeta ab{1, 3, 1, 1, {'b', ' '}};
  const SuffixMeta abcd{1, 9, 1, 2, {'c', 'd'}};
  const struct {
    std::vector<SuffixMeta> metas;
    std::string line;
  } cases[] = {
      {{aa, ab, abcd, {1, 6, 1, 0, {'b', 'a'}}}, ""},
      {{aa, ab, ab}, "Validation failed: LCP too small."},
      {{abcd, {1, 3, 1, 2, {' ', 'b'}}}, "Validation failed: Out of order."},
      {{aa, {1, 3, 1, 0, {'a', 'b'}}}, "Validation failed: LCP too small."},
      {{aa, {1, 6, 1, 0, {0, 0}}}, "Validation failed: Incorrect extra."},
  };
  for (const auto& c : cases) {
    const TemporaryDirectory directory;
    const LogCapture log;
    auto index = withPage(directory / "i", c.metas);
    ASSERT_TRUE(index);
    EXPECT_EQ(index->Validate(), c.line.empty()) << c.line;
    index.reset();
    EXPECT_EQ(log.has("error SALT: " + c.line), !c.line.empty()) << c.line;
    if (c.line.empty()) continue;
    EXPECT_FALSE(withPage(directory / "i", c.metas, true));
    EXPECT_TRUE(log.has("fault SALT: Loading failure: Validation failed."));
  }
}

TEST(Validate, OnlyLogsAWrongCount) {
  const TemporaryDirectory directory;
  ASSERT_TRUE(addZone(*newIndex(directory / "i"), 1, 1, "text"));
  salttest::editMetrics(directory / "i", [](auto& m) { m.Suffixes = m.HotSuffixes = 3; });
  const LogCapture log;
  EXPECT_TRUE(loadIndex(directory / "i")->Validate());
  EXPECT_TRUE(log.has("error SALT: Validation failed: # of suffixes: 1 != 3."));
}

TEST(Dump, ListsMetricsAndSuffixes) {
  const TemporaryDirectory directory;
  const auto index = withPage(directory / "i", {{1, 0, 1, 0, {}}, {1, 9, 1, 1, {'b', 'c'}}});
  ASSERT_TRUE(index);
  ASSERT_TRUE(addZone(*index, 2, 4, "a text longer than sixteen", {2}));
  ASSERT_TRUE(index->DeleteDoc(2));
  const std::string dump = index->Dump();
  EXPECT_TRUE(dump.starts_with("SALT INDEX METRICS\n-- Code version: 304\n"));
  EXPECT_TRUE(
      dump.ends_with("---- Scans run: 0\n\n-- SALT INDEX (HOT)\n"
                     "---- [2,4:2]: \"text longer than\"\n-- SALT INDEX (SHARD 1)\n"
                     "---- [1,1:0]: \"aa ab ba abcd\"\n---- [1,1:9 (1)+\"bc\"]: \"abcd\"\n"))
      << dump;
}
