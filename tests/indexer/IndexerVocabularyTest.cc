#include <algorithm>
#include <thread>

#include "parameters/TLParamsManager.h"
#include "tests/indexer/IndexerSupport.h"

namespace {

using testsupport::Outcome;
using testsupport::outcomeOf;

// Number of documents from which a first vocabulary is due.
constexpr int kDue = 51;

class IndexerVocabularyTest : public testsupport::IndexerTest {
 protected:
  // Mails with their subjects as identifiers.
  Outcome addSubjects(const std::vector<std::string>& subjects) {
    TALIndexer::Items items;
    for (const std::string& subject : subjects) {
      std::string identifier = subject;
      std::replace(identifier.begin(), identifier.end(), ' ', '-');
      items.push_back(testsupport::mail(identifier, subject));
    }
    return add(std::move(items));
  }
  Outcome addMany(int count) {
    std::vector<std::string> subjects;
    for (int i = 0; i < count; ++i) subjects.push_back("common " + std::to_string(i));
    return addSubjects(subjects);
  }
  // Adds enough documents for a rebuild, and waits for it and one more.
  void build() {
    ASSERT_EQ(addMany(kDue), std::nullopt);
    EXPECT_EQ(rebuild(), std::nullopt);
  }
  Outcome rebuild() {
    return outcomeOf([&](auto done) { indexer->forceRebuildTopKVocabWithCompletionHandler(done); });
  }
};

}  // namespace

TEST_F(IndexerVocabularyTest, AMistypedWordFindsTheMailOfTheRightOne) {
  ASSERT_EQ(addSubjects({"quarterly invoice attached", "meeting minutes", "invitation"}),
            std::nullopt);
  for (const char* typed :
       {"invoise", "invoce", "invvoice", "invocie", "invoise attached",
        "quarterly invoise attached", "quarterly invoice attacehd", "Qarterly invoice "}) {
    EXPECT_EQ(search(typed), "quarterly-invoice-attached") << typed;
  }
  EXPECT_EQ(search("invoise", TLParamsManager::paramsFromString(
                                  u"queryModification.enableSpellModification=NO,"
                                  u"queryModification.enableStemModification=NO")),
            "");
  EXPECT_EQ(search("qarterly invoise"), "");
  EXPECT_EQ(search("\xF0\x9F\x98\x80"), "Query processor failed to generate query terms");
  EXPECT_FALSE(log.contains("invoise"));
}

TEST_F(IndexerVocabularyTest, IsBuiltDuringIngestAndSurvivesARestart) {
  EXPECT_TRUE(indexer->topKVocabulary()->empty());
  ASSERT_EQ(addMany(kDue - 1), std::nullopt);
  EXPECT_FALSE(log.contains("Starting to rebuild topK vocab"));
  ASSERT_EQ(addMany(kDue), std::nullopt);
  EXPECT_EQ(rebuild(), std::nullopt);  // interrupts the running count, if any
  EXPECT_EQ(log.count("default TALTopKVocab: Starting to rebuild topK vocab from SALT."), 2U);
  EXPECT_TRUE(log.contains("default TALTopKVocab: Rebuild docID: 51."));
  EXPECT_EQ(indexer->topKVocabulary()->front(), "common ");
  ASSERT_EQ(addMany(kDue), std::nullopt);  // nothing new
  reopen();
  EXPECT_EQ(indexer->topKVocabulary()->size(), kDue + 1U);
  Outcome error;
  EXPECT_EQ(indexer->loadTopKVocabFromDocStore(&error)->front(), "common ");
  EXPECT_EQ(error, std::nullopt);
  EXPECT_EQ(log.count("default TALTopKVocab: Starting to rebuild topK vocab from SALT."), 2U);
}

TEST_F(IndexerVocabularyTest, AResetClearsItAndRebuildsContinue) {
  build();
  EXPECT_EQ(reset(), std::nullopt);
  EXPECT_TRUE(indexer->topKVocabulary()->empty());
  EXPECT_EQ(store->loadTopKVocab(nullptr), std::nullopt);
  build();
  EXPECT_EQ(search("comon 7"), "common-7");
}

TEST_F(IndexerVocabularyTest, AResetOrShutdownDuringARebuildNeitherHangsNorUsesFreedMemory) {
  for (int round = 0; round < 4; ++round) {
    ASSERT_EQ(addMany(kDue), std::nullopt);
    for (int i = 0; i < 3; ++i) indexer->forceRebuildTopKVocabWithCompletionHandler(nullptr);
    std::thread searching([&] { static_cast<void>(search("comon")); });
    if (round % 2 == 0) {
      EXPECT_EQ(reset(), std::nullopt);
      searching.join();
    } else {
      searching.join();
      reopen();
    }
  }
  indexer->shutdown();
  EXPECT_EQ(indexer->topKVocabulary(), nullptr);
  EXPECT_EQ(indexer->loadTopKVocabFromDocStore(nullptr), nullptr);
  indexer->forceRebuildTopKVocabWithCompletionHandler([](const Outcome&) { FAIL(); });
  EXPECT_FALSE(log.contains("cannot be saved"));
}
