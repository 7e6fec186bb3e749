#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <set>
#include <sstream>

#include "platform/Files.h"
#include "salt/Index.h"
#include "tests/salt/Model.h"
#include "tests/salt/SaltSupport.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TemporaryDirectory.h"

// Damaged and foreign files in the directory of an index: how much is still found, and what is
// logged.
namespace {

namespace fs = std::filesystem;
using salt::Index;
using salttest::addZone;
using salttest::loadIndex;
using salttest::newIndex;
using testsupport::LogCapture;

constexpr uint32_t kDocsPerFile = 100;
constexpr uint32_t kWordsPerDoc = 12;

std::string textOf(uint32_t docID) {
  std::mt19937 random(docID);
  std::string text;
  for (uint32_t i = 0; i < kWordsPerDoc; ++i) text += std::to_string(random() % 100000) + ' ';
  return text;
}

void addDocs(Index& index, uint32_t from) {
  for (uint32_t docID = from; docID < from + kDocsPerFile; ++docID) {
    const std::string text = textOf(docID);
    ASSERT_TRUE(addZone(index, docID, 1, text, salttest::wordOffsets(text)));
  }
}

// Inverts the byte at `at`; a negative position counts from the end.
void flip(const fs::path& path, int64_t at) {
  std::fstream file(path, std::ios::in | std::ios::out | std::ios::binary);
  if (at < 0) at += static_cast<int64_t>(fs::file_size(path));
  file.seekg(at);
  const int byte = file.get();
  ASSERT_NE(byte, EOF) << path;
  file.seekp(at);
  file.put(static_cast<char>(~byte));
}

// The suffixes of the documents of one file, in the order of the hot part.
std::vector<std::string> suffixesOf(uint32_t from) {
  salttest::Model model({});
  for (uint32_t docID = from; docID < from + kDocsPerFile; ++docID) {
    const std::string text = textOf(docID);
    model.addZone(docID, 1, text, salttest::wordOffsets(text), false);
  }
  return model.scan("");
}

std::set<std::string> findAll(const Index& index) {
  const std::vector<std::string> found = salttest::scan(index, "");
  const std::set<std::string> suffixes(found.begin(), found.end());
  EXPECT_EQ(suffixes.size(), found.size());  // each is found once
  return suffixes;
}

// Documents 1 to 100 in an old table, 101 to 200 in a newer one, 201 to 300 in the log. Opening
// makes three tables of them, one less than leveldb compacts.
class CorruptionTest : public testing::Test {
 protected:
  CorruptionTest() {
    auto index = newIndex(path);
    addDocs(*index, 1);
    index.reset();
    index = loadIndex(path);
    addDocs(*index, 1 + kDocsPerFile);
    index.reset();
    loadIndex(path).reset();
    tables = salttest::filesOf(path, ".ldb");
    index = loadIndex(path);
    addDocs(*index, 1 + 2 * kDocsPerFile);
  }

  void write(const std::string& name, const std::string& bytes) const {
    ASSERT_TRUE(platform::writeFileAtomically(path + '/' + name, bytes, nullptr));
  }
  [[nodiscard]] fs::path manifest() const { return salttest::filesOf(path, "MANIFEST").at(0); }

  testsupport::TemporaryDirectory directory;
  const std::string path = directory / "i";
  std::vector<fs::path> tables;  // older first
};

}  // namespace

// Checksums reveal damage in the log: the rest of the block is dropped, and recovery continues with
// the next block. A document that begins in the dropped part is lost.
TEST_F(CorruptionTest, RecoversTheOtherBlocksOfADamagedLog) {
  constexpr int64_t kBlockBytes = 32768;
  constexpr int64_t kBeforeKey = 7 + 12 + 2;  // headers of record, batch and key
  const fs::path log = salttest::newestLog(path);
  const std::string bytes = platform::readFile(log, 1 << 20, nullptr).value_or("");
  const auto size = static_cast<int64_t>(bytes.size());
  ASSERT_GT(size, 2 * kBlockBytes);
  std::vector<int64_t> starts;
  for (uint32_t docID = 201; docID <= 300; ++docID) {
    const size_t key = bytes.find("\xFF" + std::to_string(docID) + ",1");
    ASSERT_NE(key, std::string::npos);
    starts.push_back(static_cast<int64_t>(key) - kBeforeKey);
  }
  for (const int64_t at : {int64_t{10}, int64_t{20000}, int64_t{40000}, size - 1}) {
    const int64_t damaged = *std::prev(std::upper_bound(starts.begin(), starts.end(), at));
    const int64_t blockEnd = (at / kBlockBytes + 1) * kBlockBytes;
    const auto lost = std::count_if(starts.begin(), starts.end(), [&](int64_t start) {
      return start >= damaged && start < blockEnd;
    });
    fs::copy(path, directory / "copy");
    flip(fs::path(directory / "copy") / log.filename(), at);
    const auto index = loadIndex(directory / "copy");
    ASSERT_TRUE(index);
    EXPECT_EQ(findAll(*index).size(), (300 - static_cast<size_t>(lost)) * kWordsPerDoc) << at;
    EXPECT_TRUE(index->Validate()) << at;
    fs::remove_all(directory / "copy");
  }
}

// Reads do not verify checksums, but a block must decompress. Everything in other blocks and tables
// is delivered, then the scan logs the error.
TEST_F(CorruptionTest, ScansEverythingOutsideADamagedBlock) {
  constexpr ptrdiff_t kMaxKeys = 32 * 1024 / 30;  // of one block
  flip(tables.at(0), 0);
  flip(tables.at(1), 0);
  const auto index = loadIndex(path);
  ASSERT_TRUE(index);
  const LogCapture log;
  const std::set<std::string> found = findAll(*index);
  const std::string line =
      "error SALT: Error scanning index: Corruption: corrupted compressed block contents";
  EXPECT_TRUE(log.has(line));
  for (const uint32_t from : {1u, 101u, 201u}) {
    // Of each damaged table only its first keys are missing.
    const auto all = suffixesOf(from);
    const auto isFound = [&found](const auto& suffix) { return found.contains(suffix); };
    const auto first = std::find_if(all.begin(), all.end(), isFound);
    EXPECT_TRUE(std::all_of(first, all.end(), isFound)) << from;
    EXPECT_EQ(first > all.begin(), from != 201) << from;
    EXPECT_LT(first - all.begin(), kMaxKeys) << from;
  }
  EXPECT_FALSE(index->Validate());
  EXPECT_EQ(log.count(line), 2u);
}

TEST_F(CorruptionTest, ADatabaseWithDamagedMetadataDoesNotOpen) {
  const struct {
    std::function<void()> damage;
    std::string line;
  } cases[] = {
      {[&] { write("CURRENT", "garbage"); }, "Error opening db: Corruption: CURRENT file"},
      {[&] { write("CURRENT", "MANIFEST-999999\n"); }, "Error opening db: Corruption: CURRENT"},
      {[&] { flip(manifest(), 10); }, "Error opening db: Corruption: "},
      {[&] { fs::resize_file(manifest(), 0); }, "Error opening db: Corruption: no meta-nextfile"},
      {[&] { fs::remove(tables.at(0)); }, "Error opening db: Corruption: 1 missing files"},
      {[&] {
         fs::remove_all(path);
         ASSERT_TRUE(platform::writeFileAtomically(path, "a file", nullptr));
       },
       "Error opening db: IO error"},
  };
  fs::copy(path, directory / "kept");
  for (const auto& c : cases) {
    fs::remove_all(path);
    fs::copy(directory / "kept", path);
    c.damage();
    const LogCapture log;
    EXPECT_FALSE(loadIndex(path)) << c.line;
    EXPECT_TRUE(log.contains("error SALT: " + c.line)) << c.line;
  }
}

// The records of an index are read first: unreadable metrics count as another version, and any
// other unreadable record ends the process.
TEST_F(CorruptionTest, ATruncatedTableIsNotReadPastItsEnd) {
  fs::remove(salttest::newestLog(path));
  fs::copy(path, directory / "newest");
  flip(fs::path(directory / "newest") / tables.at(1).filename(), -1);
  const LogCapture log;
  EXPECT_FALSE(loadIndex(directory / "newest"));
  EXPECT_TRUE(log.has("error SALT: Loading failure: Mismatched code version."));
  flip(fs::path(path) / tables.at(0).filename(), -1);
  EXPECT_DEATH(static_cast<void>(loadIndex(path)), "status\\.ok\\(\\)");
}

// These tests use a directory each: death tests fork, and a database of few tables starts no thread
// that the fork would lose.
TEST(Corruption, InvalidOptionsEndTheProcess) {
  const auto expectDeath = [](const std::string& bytes, const char* assertion) {
    const testsupport::TemporaryDirectory directory;
    newIndex(directory / "i").reset();
    salttest::editKey(directory / "i", "\xFFOPTIONS", &bytes);
    EXPECT_DEATH(static_cast<void>(loadIndex(directory / "i")), assertion);
  };
  const std::function<void(Index::Options&)> edits[] = {
      [](auto& op) { op.MinMatchLen = op.MaxMatchLen + 1; },
      [](auto& op) { op.MaxZoneSize = UINT32_MAX; },
      [](auto& op) { op.MaxShards = 0; },
  };
  for (const auto& edit : edits) {
    Index::Options options;
    edit(options);
    std::ostringstream stream;
    ASSERT_TRUE(options.SerializeToOstream(stream));
    expectDeath(stream.str(), "op\\.Valid\\(\\)");
    const testsupport::TemporaryDirectory directory;
    EXPECT_DEATH(static_cast<void>(newIndex(directory / "i", options)), "op\\.Valid\\(\\)");
  }
  expectDeath(std::string(47, '\0'), "parseRecord\\(bytes, &op\\)");
}

namespace {

const std::string kPageKey(
    "\x01"
    "aaaa aaab\0\x01\0\x01",
    14);
const std::string kTextKey(
    "\xFF"
    "1,1");

// An index with a page of two suffixes, "aaaa aaabcd" and "aaabcd", and one key overwritten.
void makeDamagedIndex(const std::string& path, const std::string& key, const std::string& value) {
  Index::Options options;
  options.MaxHotSuffixes = 1;
  ASSERT_TRUE(addZone(*newIndex(path, options), 1, 1, "aaaa aaabcd", {0}));
  salttest::writePage(path, 1, "aaaa aaab", {{1, 0, 1, 0, {}}, {1, 5, 1, 3, {'b', 'c'}}});
  salttest::editKey(path, key, &value);
}

}  // namespace

TEST(Corruption, APageThatCannotBeReadEndsTheProcess) {
  const std::string page("\x02\x01\x01\x01\x01\0\x05\0\x03\0\0bc", 13);
  const struct {
    const std::string& key;
    std::string value;
    const char* assertion;
  } cases[] = {
      {kPageKey, "", "s\\.size\\(\\)"},
      {kPageKey, page.substr(0, 12), "s\\.size\\(\\)"},
      {kPageKey, "\x33", "size <= op\\.MaxPageSuffixes"},
      // The page has five bytes of the second suffix.
      {kTextKey, "aaaa", "text\\.size\\(\\) >= size"},
  };
  const std::function<void(Index&)> steps[] = {
      [](Index& index) { static_cast<void>(salttest::scan(index, "aaabcd")); },
      [](Index& index) { static_cast<void>(index.Validate()); },
      [](Index& index) { static_cast<void>(index.Dump()); },
  };
  for (const auto& c : cases) {
    const testsupport::TemporaryDirectory directory;
    makeDamagedIndex(directory / "i", c.key, c.value);
    for (const auto& step : steps) {
      EXPECT_DEATH(step(*loadIndex(directory / "i")), c.assertion);
    }
  }
}

TEST(Corruption, APageThatCannotBeReadEndsAMerge) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  const testsupport::TemporaryDirectory directory;
  makeDamagedIndex(directory / "i", kPageKey, "\x33");
  EXPECT_DEATH(loadIndex(directory / "i")->Vacuum(), "size <= op\\.MaxPageSuffixes");
}

TEST_F(CorruptionTest, ForeignFilesAreLeftAloneAndDoNoHarm) {
  const std::string garbage(70000, '\x7f');
  write("notes.txt", "mine");
  fs::create_directory(path + "/subdirectory");
  write("subdirectory/CURRENT", "mine");
  // leveldb recognises these names: it removes the files or, for the log, reads records from it.
  write("999999.ldb", garbage);
  write("999998.log", garbage);
  write("MANIFEST-999997", garbage);
  write("999996.dbtmp", garbage);
  for (uint32_t round = 0; round < 2; ++round) {
    const auto index = loadIndex(path);
    ASSERT_TRUE(index);
    EXPECT_EQ(findAll(*index).size(), 300 * kWordsPerDoc);
    EXPECT_TRUE(index->Validate());
    EXPECT_TRUE(addZone(*index, 301 + round, 1, "one more", {}));
  }
  EXPECT_EQ(platform::readFile(path + "/notes.txt", 100, nullptr), "mine");
  EXPECT_EQ(platform::readFile(path + "/subdirectory/CURRENT", 100, nullptr), "mine");
}
