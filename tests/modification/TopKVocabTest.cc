#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <latch>
#include <random>
#include <tuple>

#include "docstore/TALSqliteDocStore.h"
#include "modification/TALTopKVocab.h"
#include "modification/TopKVocabArchive.h"
#include "platform/Clock.h"
#include "tests/salt/SaltSupport.h"
#include "tests/support/LogCapture.h"
#include "tests/support/Outcome.h"
#include "tests/support/SQLiteConnection.h"
#include "tests/support/Seed.h"
#include "tests/support/TemporaryDirectory.h"

using testing::ElementsAre;

namespace {

using testsupport::Outcome;
using testsupport::outcomeOf;
using Words = TALTopKVocab::Words;

// An index of a hundred zones that counts the zones iterated over, and can wait at the first one.
class WatchedIndex : public salt::Index {
 public:
  mutable std::atomic<int> zones = 0;
  bool waitsAtFirst = false;
  mutable std::latch reached{1};
  mutable std::latch goesOn{1};

  void ForEachZone(
      std::function<bool(uint32_t, uint16_t, std::string_view)> callback) const override {
    for (uint32_t docID = 1; docID <= 100; ++docID) {
      if (++zones == 1 && waitsAtFirst) {
        reached.count_down();
        goesOn.wait();
      }
      if (!callback(docID, 1, "word ")) return;
    }
  }

  MOCK_METHOD(const Options&, GetOptions, (), (const, override));
  MOCK_METHOD(std::string, GetSuffixText, (const salt::SuffixMeta&), (const, override));
  MOCK_METHOD(bool, AddZone, (uint32_t, uint16_t, std::string_view, std::vector<uint32_t>&, bool),
              (override));
  MOCK_METHOD(bool, DeleteDoc, (uint32_t), (override));
  MOCK_METHOD(bool, DeleteDocs, (const std::vector<uint32_t>&), (override));
  MOCK_METHOD(bool, ScanPrefix, (std::string_view, std::function<bool(const salt::SuffixMeta&)>),
              (const, override));
  MOCK_METHOD(std::vector<std::shared_ptr<const salt::FoundPlaces>>, ScanPlaces,
              (const std::vector<std::string_view>&, uint64_t), (const, override));
  MOCK_METHOD(std::vector<std::vector<salt::SuffixMeta>>, ScanPrefixes,
              (const std::vector<std::string>&, size_t), (const, override));
  MOCK_METHOD(void, Vacuum, (), (override));
  MOCK_METHOD(bool, Sync, (), (override));
  MOCK_METHOD(bool, Compact, (), (override));
  MOCK_METHOD(Metrics, GetMetrics, (), (const, override));
  MOCK_METHOD(void, ResetScanMetrics, (), (override));
  MOCK_METHOD(bool, Validate, (), (const, override));
  MOCK_METHOD(std::string, Dump, (), (const, override));
  MOCK_METHOD(void, WaitForMaintenance, (), (override));
  MOCK_METHOD(void, Interrupt, (), (override));
};

class TopKVocabTest : public testing::Test {
 protected:
  TopKVocabTest() { EXPECT_TRUE(store->openWithError(nullptr)); }

  static Outcome rebuild(TALTopKVocab& vocab) {
    return outcomeOf(
        [&vocab](auto done) { vocab.checkAndRebuildTopKVocabWithCompletionHandler(done, true); });
  }

  // What a vocabulary of one old word holds after loading the blob: whether there was an error, the
  // words, the document ID, and the date.
  using Loaded = std::tuple<bool, Words, uint32_t, double>;
  Loaded load(const std::string& blob) {
    store->storeTopKVocab(blob, nullptr);
    TALTopKVocab vocab(store, index.get());
    vocab.setVocab({"old"});
    vocab.setLastTopKRebuildDocID(1);
    vocab.setLastTopKRebuildDate(1);
    Outcome error;
    vocab.loadTopKVocabFromDocStore(&error);
    return {error.has_value(), *vocab.vocab(), vocab.lastTopKRebuildDocID(),
            vocab.lastTopKRebuildDate()};
  }

  const testsupport::TemporaryDirectory directory;
  const testsupport::LogCapture log;
  const std::shared_ptr<TALSqliteDocStore> store =
      std::make_shared<TALSqliteDocStore>(directory / "docs.db");
  std::unique_ptr<salt::Index> index = salttest::newIndex(directory / "i");
};

}  // namespace

TEST_F(TopKVocabTest, RebuildIsDueByDocumentsAddedAndByAge) {
  const double now = platform::secondsSince1970();
  const double old = now - 432010;
  const struct {
    uint32_t last;
    uint32_t maxDocID;
    bool words;
    double date;
    bool due;
  } cases[] = {
      {0, 50, false, now, false},         {0, 50, true, old, false},
      {0, 51, false, now, true},          {0, 100, true, now, true},
      {1000, 1500, true, now, false},     {1000, 1500, true, old, true},
      {1000, 1501, true, now, true},      {1000, 1500, false, now, true},
      {100000, 102000, true, now, false}, {100000, 102001, true, now, true},
      {100000, 99000, true, old, false},  {100000, 100050, true, old, false},
      {100000, 100051, true, old, true},
  };
  TALTopKVocab vocab(store, index.get());
  for (const auto& c : cases) {
    vocab.setLastTopKRebuildDocID(c.last);
    vocab.setMaxDocID(c.maxDocID);
    vocab.setLastTopKRebuildDate(c.date);
    vocab.setVocab(c.words ? Words{"word"} : Words{});
    EXPECT_EQ(vocab._needRebuildTopKVocab(), c.due) << c.last << ' ' << c.maxDocID;
  }
  vocab.setLastTopKRebuildDocID(0);
  vocab.setMaxDocID(50);
  vocab.checkAndRebuildTopKVocabWithCompletionHandler([](const Outcome&) { FAIL(); }, false);
  vocab.shutdown();
  EXPECT_FALSE(log.contains("Starting to rebuild"));
}

TEST_F(TopKVocabTest, CountsStoresAndSurvivesARestart) {
  ASSERT_TRUE(salttest::addZone(*index, 1, 1, "b a b c\xF0\x9F\x98\x80 b"));
  {
    TALTopKVocab vocab(store, index.get());
    EXPECT_FALSE(log.contains("TopK loaded from docstore."));
    EXPECT_TRUE(log.has("default TALTopKVocab: Last topK rebuild docID: 0."));
    EXPECT_TRUE(log.has("default TALTopKVocab: Last topK has 0 tokens."));
    vocab.setMaxDocID(77);
    EXPECT_EQ(rebuild(vocab), std::nullopt);
    vocab.setMaxDocID(200);
    EXPECT_THAT(*vocab.vocab(), ElementsAre("b ", "a ", "b", "c\xF0\x9F\x98\x80 "));
    const auto lines = log.lines();
    auto at = lines.begin();
    for (const char* text :
         {"Starting to rebuild topK vocab from SALT.", "Rebuild date: 20", "Rebuild docID: 77.",
          "TopK vocab has 4 tokens.", "TopK vocab rebuild is done.",
          "Rebuilt topK vocab saved to docstore."}) {
      at = std::find_if(at, lines.end(),
                        [&](const auto& l) { return l.find(text) != std::string::npos; });
      EXPECT_NE(at, lines.end()) << text;
    }
  }
  const TALTopKVocab again(store, index.get());
  EXPECT_THAT(*again.vocab(), ElementsAre("b ", "a ", "b", "c\xF0\x9F\x98\x80 "));
  EXPECT_EQ(again.lastTopKRebuildDocID(), 77U);
  EXPECT_EQ(again.maxDocID(), 77U);  // the count of documents since the last rebuild is reset
  EXPECT_NEAR(again.lastTopKRebuildDate(), platform::secondsSince1970(), 60);
  EXPECT_TRUE(log.has("default TALTopKVocab: TopK loaded from docstore."));
}

TEST_F(TopKVocabTest, AnEmptyIndexGivesAnEmptyVocabularyWithoutAnError) {
  TALTopKVocab vocab(store, index.get());
  EXPECT_EQ(rebuild(vocab), std::nullopt);
  Outcome error;
  vocab.loadTopKVocabFromDocStore(&error);
  EXPECT_EQ(error, std::nullopt);
  EXPECT_TRUE(vocab.vocab()->empty());
  TALTopKVocab nothing(nullptr, nullptr);
  nothing.checkAndRebuildTopKVocabWithCompletionHandler([](const Outcome&) { FAIL(); }, true);
  nothing.shutdown();
  EXPECT_TRUE(nothing.vocab()->empty());
}

TEST_F(TopKVocabTest, KeepsTheUndamagedPartsOfABlob) {
  const std::string words = "\x82\x63one\x63two";
  const std::string docID = "\x18\x64";
  const std::string date = std::string("\xFB\x41\xD9\0\0\0\0\0\0", 9);  // 1677721600
  const auto entry = [](const std::string& bytes) {
    return static_cast<char>(0x40 + bytes.size()) + bytes;
  };
  const auto three = [&](const std::string& a, const std::string& b, const std::string& c) {
    return "\x83" + entry(a) + entry(b) + entry(c);
  };
  const Words old{"old"};
  const Words stored{"one", "two"};
  const std::pair<std::string, Loaded> cases[] = {
      {three(words, docID, date), {false, stored, 100, 1677721600}},
      {"\x82" + entry(words) + entry(docID), {false, old, 1, 1}},
      {"\x80", {false, old, 1, 1}},
      {"", {true, old, 1, 1}},
      {"\x83\x01\x02\x03", {true, old, 1, 1}},
      {three(words, docID, date) + "x", {true, old, 1, 1}},
      {std::string(1000000, '\x81'), {true, old, 1, 1}},
      {three("\x01", docID, date), {true, {}, 1, 1}},
      {three("\x82\x63one", docID, date), {true, {}, 1, 1}},
      {three("\x9B\xFF\xFF\xFF\xFF\xFF\xFF\xFF\xFF", docID, date), {true, {}, 1, 1}},
      {three("", docID, date), {true, {}, 1, 1}},
      {three(words, std::string("\x1B\0\0\0\1\0\0\0\0", 9), date), {true, stored, 1, 1677721600}},
      {three(words, docID, "\x01"), {true, stored, 100, 1}},
      {three(words, docID, "\xF9\x3C"), {true, stored, 100, 1}},
  };
  for (const auto& [bytes, expected] : cases) {
    EXPECT_EQ(load(bytes), expected) << testing::PrintToString(bytes.substr(0, 40));
  }
  EXPECT_TRUE(log.contains("error TALTopKVocab: TopK cannot be unarchived: TALTopKVocab 1: "));
}

TEST_F(TopKVocabTest, ReadsTruncatedOrChangedBlobsSafely) {
  const std::string blob = topkvocab::archive({"one", std::string(300, 'x'), ""}, 70000, 1.5e9);
  EXPECT_EQ(load(blob), Loaded(false, {"one", std::string(300, 'x'), ""}, 70000, 1.5e9));
  for (size_t size = 0; size < blob.size(); ++size) {
    ASSERT_FALSE(topkvocab::unarchive(std::string_view(blob).substr(0, size))) << size;
  }
  std::mt19937 random(testsupport::firstSeed());
  for (int round = 0; round < 20000; ++round) {
    std::string bytes = blob;
    for (size_t n = 1 + random() % 4; n > 0; --n) {
      bytes[random() % std::min<size_t>(bytes.size(), 40)] = static_cast<char>(random());
    }
    const auto entries = topkvocab::unarchive(bytes);
    if (!entries || entries->size() != 3) continue;
    if (const auto words = topkvocab::unarchiveWords(entries->at(0))) {
      ASSERT_LE(words->size(), bytes.size());
    }
    static_cast<void>(topkvocab::unarchiveDocID(entries->at(1)));
    static_cast<void>(topkvocab::unarchiveDate(entries->at(2)));
  }
}

// The rest would last for hours if nothing ended it.
TEST_F(TopKVocabTest, ARequestedRebuildAndShutdownEndTheRestOfARoutineOne) {
  constexpr int kForHours = 1000000000;
  WatchedIndex watched;
  TALTopKVocab vocab(store, &watched, kForHours);
  EXPECT_EQ(rebuild(vocab), std::nullopt);
  vocab.setMaxDocID(2001);
  vocab.checkAndRebuildTopKVocabWithCompletionHandler(nullptr, false);
  EXPECT_EQ(watched.zones, 200);
  EXPECT_EQ(rebuild(vocab), std::nullopt);
  EXPECT_EQ(watched.zones, 402);  // the routine rebuild gives way at once
  vocab.setMaxDocID(5000);
  vocab.checkAndRebuildTopKVocabWithCompletionHandler(nullptr, false);
  vocab.shutdown();
  EXPECT_EQ(watched.zones, 402);
}

TEST_F(TopKVocabTest, ShutdownEndsTheRunningCountAndWaitingRebuilds) {
  auto watched = std::make_unique<WatchedIndex>();
  watched->waitsAtFirst = true;
  TALTopKVocab vocab(store, watched.get());
  vocab.setVocab({"old"});
  std::vector<Outcome> outcomes;
  const auto keep = [&outcomes](const Outcome& outcome) { outcomes.push_back(outcome); };
  vocab.checkAndRebuildTopKVocabWithCompletionHandler(keep, true);
  vocab.checkAndRebuildTopKVocabWithCompletionHandler(keep, true);
  watched->reached.wait();
  vocab.setMaxDocID(2001);
  for (int batch = 0; batch < 3; ++batch) {
    vocab.checkAndRebuildTopKVocabWithCompletionHandler(nullptr, false);
  }
  std::thread ending([&] { vocab.shutdown(); });
  while (!vocab.isShutdown()) std::this_thread::yield();
  watched->goesOn.count_down();
  ending.join();
  EXPECT_EQ(watched->zones, 2);  // one per pass
  watched.reset();
  store->close();
  EXPECT_THAT(*vocab.vocab(), ElementsAre("old"));
  EXPECT_TRUE(log.has("default TALTopKVocab: TopKVocab is shutting down before storeTopKVocab."));
  // One requested rebuild, and one for three batches.
  EXPECT_EQ(log.count("default TALTopKVocab: TopKVocab is shutting down before TopKTokens."), 2U);
  EXPECT_FALSE(log.contains("saved to docstore"));
  // No rebuild starts any more.
  vocab.checkAndRebuildTopKVocabWithCompletionHandler(keep, true);
  vocab.shutdown();
  EXPECT_THAT(outcomes, ElementsAre(std::nullopt, std::nullopt, std::nullopt));
}

TEST_F(TopKVocabTest, ARequestedRebuildEndsARoutineCount) {
  WatchedIndex watched;
  watched.waitsAtFirst = true;
  TALTopKVocab vocab(store, &watched);
  vocab.setMaxDocID(2001);
  vocab.checkAndRebuildTopKVocabWithCompletionHandler(nullptr, false);
  watched.reached.wait();
  EXPECT_EQ(outcomeOf([&](auto done) {
              vocab.checkAndRebuildTopKVocabWithCompletionHandler(done, true);
              watched.goesOn.count_down();
            }),
            std::nullopt);
  EXPECT_EQ(log.count("Starting to rebuild topK vocab from SALT."), 2U);
  EXPECT_EQ(log.count("TopK vocab rebuild is done."), 1U);
  vocab.shutdown();
}

TEST_F(TopKVocabTest, ALoadNeverBringsOlderWordsBack) {
  TALTopKVocab vocab(store, index.get());
  std::optional<TLError> error;
  store->storeTopKVocab(topkvocab::archive({"stored"}, 1, platform::secondsSince1970()), &error);
  vocab.loadTopKVocabFromDocStore(&error);
  ASSERT_EQ(error, std::nullopt);
  ASSERT_THAT(*vocab.vocab(), ElementsAre("stored"));
  {
    testsupport::SQLiteConnection other(directory / "docs.db");
    other.run("BEGIN IMMEDIATE");  // blocks writes to the store
    EXPECT_NE(rebuild(vocab), std::nullopt);
    vocab.loadTopKVocabFromDocStore(&error);
    EXPECT_THAT(*vocab.vocab(), testing::IsEmpty());
  }
  EXPECT_EQ(rebuild(vocab), std::nullopt);
  vocab.shutdown();
}
