#include <gtest/gtest.h>

#include <random>
#include <set>

#include "platform/Files.h"
#include "salt/Postings.h"
#include "tests/salt/Model.h"
#include "tests/salt/SaltSupport.h"
#include "tests/support/LogCapture.h"
#include "tests/support/TemporaryDirectory.h"

// Scans with posting lists compared with scans of the pages.
namespace {

namespace fs = std::filesystem;
using salt::Index;

class PostingsTest : public testing::Test {
 protected:
  static constexpr size_t kPrefixes = 300;

  PostingsTest() {
    options.MaxHotSuffixes = 400;
    options.MaxShardSuffixes = 2000;  // gives prefixes with 2 or more suffixes a posting list
    options.MaxShards = 3;
    options.MaxPageSuffixes = 10;
    index = salttest::newIndex(path, options);
  }

  void addDocs(uint32_t count) {
    for (; count > 0; --count) {
      ++lastDoc;
      std::string text;
      for (int word = 0; word < 60; ++word) {
        text += std::string("aab")[random() % 3];
        for (auto length = random() % 5; length > 0; --length) text += "abc"[random() % 3];
        text += ' ';
      }
      const auto zone = static_cast<uint16_t>(1 + random() % 5 + 100 * (random() % 3));
      ASSERT_TRUE(salttest::addZone(*index, lastDoc, zone, text, salttest::wordOffsets(text)));
      for (size_t length = 1; length < 12; ++length) {
        if (prefixes.size() < kPrefixes) prefixes.insert(text.substr(0, length));
      }
    }
  }
  void merge() {
    index->Vacuum();
    reopen();  // waits for the merge
  }
  void reopen() {
    index.reset();
    index = salttest::loadIndex(path);
    ASSERT_NE(index, nullptr);
  }
  // All keys and values but the counters.
  salttest::Keys contents() {
    index.reset();
    salttest::Keys keys = salttest::readKeys(path);
    keys.erase("\xFFMETRICS");
    return keys;
  }
  [[nodiscard]] std::vector<fs::path> files() const { return salttest::filesOf(path, "postings-"); }
  void expectSame() const {
    for (const std::string& prefix : prefixes) {
      ASSERT_EQ(salttest::scanPlaces(*index, prefix),
                salttest::placesOf(salttest::scan(*index, prefix)))
          << prefix;
    }
  }
  // How many pages scans read, for the most frequent prefixes unless others are given.
  [[nodiscard]] uint64_t pageReads(const std::vector<std::string>& scanned = {"a", "aa", "b",
                                                                              "ab"}) const {
    const uint64_t before = index->GetMetrics().ScanPageReads;
    for (const std::string& prefix : scanned) {
      EXPECT_TRUE(salttest::scanPlaces(*index, prefix));
    }
    return index->GetMetrics().ScanPageReads - before;
  }

  testsupport::TemporaryDirectory directory;
  const std::string path = directory / "index";
  Index::Options options;
  std::unique_ptr<Index> index;
  std::mt19937 random{11};
  uint32_t lastDoc = 0;
  std::set<std::string> prefixes;
};

}  // namespace

TEST_F(PostingsTest, AnyNumberOfZones) {
  for (uint16_t zone = 1; zone <= 40; ++zone) {
    const std::string text = "same same same same same ";
    ASSERT_TRUE(salttest::addZone(*index, 7, zone, text, salttest::wordOffsets(text)));
  }
  addDocs(20);
  prefixes.insert({"s", "same", "same s", "same same same same same "});
  merge();
  EXPECT_FALSE(files().empty());
  expectSame();
}

TEST_F(PostingsTest, InvalidFilesAreIgnoredAndRebuilt) {
  addDocs(100);
  merge();
  ASSERT_FALSE(files().empty());
  const fs::path file = files().front();
  const std::string good = platform::readFile(file, 1 << 20, nullptr).value();
  const uint64_t byPostings = pageReads();
  std::vector<std::string> contents{"", good.substr(0, 20), good.substr(0, good.size() / 2),
                                    good + "more", std::string(good.size(), '\xFF')};
  for (const size_t at : {size_t{0}, size_t{9}, size_t{17}, size_t{25}, size_t{33}, size_t{41},
                          size_t{50}, size_t{70}}) {
    contents.push_back(good);
    contents.back()[at] ^= 0x20;
  }
  // A list is checked when it is read; this is the list of some prefix.
  std::string list = good;
  list[good.size() - 20] ^= 0x20;
  index.reset();
  ASSERT_TRUE(platform::writeFileAtomically(file, list, nullptr));
  index = salttest::loadIndex(path);
  expectSame();
  for (const std::string& content : contents) {
    testsupport::LogCapture log;
    index.reset();
    ASSERT_TRUE(platform::writeFileAtomically(file, content, nullptr));
    index = salttest::loadIndex(path);
    expectSame();
    EXPECT_TRUE(log.contains("Postings"));
  }
  index.reset();
  fs::remove(file);
  fs::create_directory(file);  // cannot be read, removed as a file, or replaced
  index = salttest::loadIndex(path);
  EXPECT_GT(pageReads(), byPostings);
  expectSame();
  index.reset();
  fs::remove(file);
  index = salttest::loadIndex(path);
  ASSERT_TRUE(index->Compact());
  EXPECT_EQ(platform::readFile(file, 1 << 20, nullptr), good);
  EXPECT_EQ(pageReads(), byPostings);
  expectSame();
}

// Words that nearly always follow one another share their documents.
TEST_F(PostingsTest, OnlyTheMostFrequentPrefixesHaveAListWhereSpaceDoesNotSuffice) {
  options.MaxHotSuffixes = 100000;
  index.reset();
  fs::remove_all(path);
  index = salttest::newIndex(path, options);
  addDocs(300);
  for (int i = 0; i < 60000; ++i) {
    const auto number = random() % 16 * (random() % 16);  // some words are frequent
    const std::string word{static_cast<char>('p' + number / 16),
                           static_cast<char>('a' + number % 16)};
    const std::string text = word + (i % 9 == 0 ? " other" : " same words end") + " here ";
    const auto offsets = salttest::wordOffsets(text);
    ASSERT_TRUE(
        salttest::addZone(*index, ++lastDoc, static_cast<uint16_t>(1 + i % 3), text, offsets));
    if (i < 9) prefixes.insert({text.substr(0, 1), text, text.substr(word.size() + 1)});
  }
  for (const char* prefix : {"s", "same", "same words e", "words", "words end h", "h", "e"})
    prefixes.insert(prefix);
  merge();
  ASSERT_EQ(files().size(), 1u);
  EXPECT_LT(fs::file_size(files().front()), 200000u);
  EXPECT_EQ(pageReads({"s", "same", "words", "end h"}), 0u);
  EXPECT_GT(pageReads({"aa"}), 0u);
  expectSame();
}

TEST_F(PostingsTest, MakingMissingFilesChangesNoPage) {
  addDocs(100);
  merge();
  ASSERT_TRUE(index->Compact());
  const auto before = contents();
  ASSERT_EQ(files().size(), 1u);
  fs::remove(files().front());
  reopen();
  ASSERT_TRUE(index->Compact());
  EXPECT_EQ(files().size(), 1u);
  EXPECT_EQ(contents(), before);
}

// Histories compare scans after deletions as well.
TEST_F(PostingsTest, EachShardHasAFileAndThoseOfAnotherShardOrIndexAreNotUsed) {
  for (int i = 0; i < 6; ++i) {
    addDocs(60);
    merge();
    expectSame();
  }
  ASSERT_EQ(files().size(), 3u);
  reopen();  // without cached scans
  EXPECT_EQ(pageReads(), 0u);
  index.reset();
  fs::copy_file(files()[0], files()[1], fs::copy_options::overwrite_existing);
  reopen();
  expectSame();
  EXPECT_FALSE(fs::exists(salt::postingsPath(path, 2)));
  index.reset();
  salttest::editMetrics(path, [](Index::Metrics& metrics) { ++metrics.CreationTime; });
  reopen();
  EXPECT_TRUE(files().empty());
  expectSame();
}

TEST_F(PostingsTest, AMergeSucceedsEvenIfTheFileCannotBeWritten) {
  testsupport::LogCapture log;
  fs::create_directory(salt::postingsPath(path, 1) + ".new");
  addDocs(20);
  for (int i = 0; i < 2; ++i) merge();
  EXPECT_TRUE(log.contains("Error writing postings"));
  EXPECT_FALSE(fs::exists(salt::postingsPath(path, 1)));
  EXPECT_LT(index->GetMetrics().HotSuffixes, options.MaxHotSuffixes);
  expectSame();
}
