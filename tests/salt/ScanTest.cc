#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <atomic>
#include <map>
#include <set>
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
using salttest::Place;
using salttest::scan;
using testing::ElementsAre;
using testsupport::TemporaryDirectory;
using namespace std::string_literals;

namespace {

// All texts and places of an index in memory, with the index itself.
class Model {
 public:
  Model(uint32_t seed, const std::string& path, Index::Options options)
      : random(seed), _path(path), _options(std::move(options)), index(newIndex(path, _options)) {}

  // Adds or appends a zone; each offset goes to a random shard up to `shards`.
  void addRandomZone(unsigned shards) {
    const auto docID = static_cast<uint32_t>(1 + random() % 300);
    const auto zoneID = static_cast<uint16_t>(random() % 3 == 0 ? 100 + random() % 60 : 1);
    const std::string text = salttest::randomText(random, random() % 300);
    std::string& stored = _texts[{docID, zoneID}];
    if (_deleted.count(docID) || stored == text) return;
    const size_t base = stored.empty() ? 0 : stored.size() + 1;
    std::vector<uint32_t> hot;
    std::vector<Place> places;
    for (const uint32_t offset : salttest::randomOffsets(random, text)) {
      const auto shard = static_cast<uint8_t>(random() % (shards + 1));
      if (shard == 0) hot.push_back(offset);
      places.push_back({shard, docID, zoneID, static_cast<uint32_t>(base + offset),
                        salttest::naiveCut(std::string_view(text).substr(offset), _options)});
    }
    ASSERT_TRUE(addZone(*index, docID, zoneID, text, hot));
    if (base != 0) stored += '\0';
    stored += text;
    _places.insert(_places.end(), places.begin(), places.end());
  }

  void deleteRandomDoc() {
    const auto docID = static_cast<uint32_t>(1 + random() % 300);
    ASSERT_TRUE(index->DeleteDoc(docID));
    _deleted.insert(docID);
  }

  void reopen() {
    index.reset();
    index = loadIndex(_path);
    ASSERT_TRUE(index);
  }

  // Writes the places that are not hot as pages.
  void writeShards(unsigned shards) {
    index.reset();
    for (unsigned shard = 1; shard <= shards; ++shard) {
      std::vector<Place> mine;
      for (const Place& place : _places) {
        if (place.shard == shard) mine.push_back(place);
      }
      salttest::writeShard(_path, mine, random);
    }
    reopen();
  }

  // A prefix that often occurs: of a place, of a whole text, changed at the end, or random.
  std::string randomPrefix() {
    if (_places.empty() || random() % 8 == 0) {
      return salttest::randomText(random, random() % 150);
    }
    const Place& place = _places[random() % _places.size()];
    std::string text =
        random() % 4 == 0 ? _texts[{place.docID, place.zoneID}].substr(place.offset) : place.text;
    const auto kind = random() % 4;
    text.resize(std::min<size_t>(text.size(), kind == 0 ? random() % 130 : random() % 6));
    if (random() % 4 == 0) text += "a \0z"s[random() % 4];
    return text;
  }

  std::vector<std::string> naiveScan(const std::string& prefix) {
    const std::string cut = salttest::naiveCut(prefix, _options);
    std::vector<Place> found;
    for (const Place& place : _places) {
      if (place.text.substr(0, cut.size()) == cut && !_deleted.count(place.docID)) {
        found.push_back(place);
      }
    }
    std::sort(found.begin(), found.end());
    std::vector<std::string> lines;
    for (const Place& p : found)
      lines.push_back(fmt::format("{},{}:{}", p.docID, p.zoneID, p.offset));
    return lines;
  }

  void expectSameScans(int rounds) {
    for (int round = 0; round < rounds; ++round) {
      const std::string prefix = round == 0 ? "" : randomPrefix();
      ASSERT_EQ(scan(*index, prefix), naiveScan(prefix)) << testing::PrintToString(prefix);
    }
  }

  std::mt19937 random;

 private:
  std::string _path;
  Index::Options _options;
  std::map<std::pair<uint32_t, uint16_t>, std::string> _texts;
  std::vector<Place> _places;
  std::set<uint32_t> _deleted;

 public:
  std::unique_ptr<Index> index;
};

Index::Options matchLengths(uint8_t least, uint8_t most) {
  Index::Options options;
  options.MinMatchLen = least;
  options.MaxMatchLen = most;
  return options;
}

const Index::Options kLengths[] = {matchLengths(32, 100), matchLengths(3, 10), matchLengths(0, 255),
                                   matchLengths(1, 1)};

}  // namespace

TEST(ScanPrefix, FindsWhatANaiveScanFindsOverARandomHistory) {
  for (uint32_t seed = 0; seed < std::size(kLengths); ++seed) {
    const TemporaryDirectory directory;
    Model model(100 + seed, directory / "i", kLengths[seed]);
    for (int step = 0; step < 150; ++step) {
      const auto dice = model.random() % 20;
      if (dice == 0) {
        model.deleteRandomDoc();
      } else if (dice == 1) {
        model.reopen();
      } else {
        model.addRandomZone(0);
      }
      if (step % 10 == 0) model.expectSameScans(15);
    }
    EXPECT_TRUE(model.index->Validate());
  }
}

TEST(ScanPrefix, FindsWhatANaiveScanFindsInPagesOfSeveralShards) {
  for (uint32_t seed = 0; seed < 2 * std::size(kLengths); ++seed) {
    const TemporaryDirectory directory;
    Model model(200 + seed, directory / "i", kLengths[seed % std::size(kLengths)]);
    const unsigned shards = seed % 2 == 0 ? 3 : 16;
    for (int zone = 0; zone < 120; ++zone) model.addRandomZone(shards);
    model.writeShards(shards);
    EXPECT_TRUE(model.index->Validate());
    model.expectSameScans(60);
    for (int doc = 0; doc < 20; ++doc) model.deleteRandomDoc();
    for (int zone = 0; zone < 20; ++zone) model.addRandomZone(0);
    model.expectSameScans(40);
  }
}

TEST(ScanPrefix, StopsWhenToldAndCountsWhatItDid) {
  const TemporaryDirectory directory;
  auto index = newIndex(directory / "i");
  ASSERT_TRUE(addZone(*index, 1, 1, "alpha beta gamma", {0, 6}));
  ASSERT_TRUE(addZone(*index, 2, 1, "alpha beta delta", {}));
  index.reset();
  // The second suffix of the page is known for 12 bytes only.
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

// A new shard without pages, and a first byte that only the neighbours of a shard have.
TEST(ScanPrefix, PassesOverShardsWithoutPages) {
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

TEST(ScanPrefix, RunsBesideAddZone) {
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
      {{1, 0, 1, 3, {'x', 'y'}}, "abcxy", false},  // may go on
      {{1, 0, 1, 3, {'x', 0}}, "abcx", true},
      {{1, 0, 1, 3, {0, 0}}, "abc", true},
      {{1, 0, 1, 0, {0, 0}}, "", false},  // nothing known is fetched
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
  suffix.fromNextMeta({1, 0, 1, 4, {'e', 0}});  // common with more than is known: nothing changes
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
  suffix.fromNextMeta({1, 0, 1, 0, {'a', 'b'}});  // its zone is not there
  EXPECT_DEATH(suffix.fetch(), "size\\(\\) >= size");
}
