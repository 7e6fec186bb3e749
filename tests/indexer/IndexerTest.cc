#include <gtest/gtest.h>
#include <sys/resource.h>

#include <cmath>
#include <random>
#include <thread>

#include "parameters/TLParamsManager.h"
#include "platform/Files.h"
#include "platform/StateCapture.h"
#include "tests/indexer/IndexerSupport.h"
#include "tests/salt/SaltSupport.h"

namespace {

using enum TLAttributeKey;
using testsupport::IndexerTest;
using testsupport::mail;
using testsupport::Outcome;

std::shared_ptr<TLParameters> parameters(TLStringView text) {
  return TLParamsManager::paramsFromString(text);
}

}  // namespace

TEST_F(IndexerTest, FindsByWordPhraseAndPrefixAndRanksByZone) {
  ASSERT_EQ(add({mail("body", "Monday", "the invoice for lunch"),
                 mail("subject", "Invoice for lunch"), mail("other", "Dinner", "an invitation")}),
            std::nullopt);
  EXPECT_EQ(search("invoice"), "subject body");
  EXPECT_EQ(search("inv"), "subject other body");
  EXPECT_EQ(search("inv ", parameters(u"queryModification.enableStemModification=NO")), "");
  EXPECT_EQ(search("invoice for lunch"), "subject body");
  EXPECT_EQ(search("lunch invoice"), "subject body");
  EXPECT_EQ(search("INVOICE, dinner"), "");
  EXPECT_EQ(search("?!"), "Query processor failed to generate query terms");
  EXPECT_TRUE(log.has("error TALIndexer: Query processor failed to generate query terms"));
}

TEST_F(IndexerTest, TiesAreOrderedByDateThenIdentifier) {
  ASSERT_EQ(
      add({mail("a", "x", "", 1000000), mail("b", "x", "", 3000000), mail("c", "x", "", 1000000)}),
      std::nullopt);
  EXPECT_EQ(search("x"), "b c a");
  const double recent = 1.7e9;  // where consecutive floats are 128 seconds apart
  ASSERT_EQ(add({mail("m", "near", "", recent + 64), mail("n", "near", "", recent)}), std::nullopt);
  EXPECT_EQ(search("near"), "n m");
}

TEST_F(IndexerTest, TopResultsMatchTheFullRankingWhateverDatesAreCached) {
  const auto expectFirstOfAll = [&](const std::string& when) {
    TLQuery query;
    query.setOriginalQuery(u"word");
    query.setSearchParams(
        parameters(u"ranking.rankingLogsItemCap=0"));  // otherwise logging would read them
    const auto all = indexer->search(query, nullptr);
    for (const size_t most : {0, 1, 2, 3, 7, 19, 20, 100}) {
      size_t count = 0;
      const auto best = indexer->search(query, nullptr, most, &count);
      EXPECT_EQ(count, all.size()) << when;
      ASSERT_EQ(best.size(), std::min(most, all.size())) << when;
      for (size_t i = 0; i < best.size(); ++i) {
        EXPECT_EQ(best[i]->identifier(), all[i]->identifier()) << when << ' ' << most << ' ' << i;
        EXPECT_EQ(best[i]->card()->lightScore(), all[i]->card()->lightScore());
      }
    }
  };
  std::mt19937 random(3);
  const auto some = [&](int number) {
    const bool inSubject = random() % 2 == 0;
    return mail("id" + std::to_string(number), inSubject ? "word" : "none", "word",
                1000000.0 * (random() % 4));
  };
  TALIndexer::Items items;
  for (int i = 0; i < 20; ++i) items.push_back(some(i));
  ASSERT_EQ(add(items), std::nullopt);
  expectFirstOfAll("added");
  reopen();
  expectFirstOfAll("nothing is known");
  ASSERT_EQ(add({some(3), some(4), some(5), some(20)}), std::nullopt);
  ASSERT_EQ(remove({u"id6", u"id7"}), std::nullopt);
  expectFirstOfAll("changed");
  ASSERT_TRUE(store->deleteDocument(2, nullptr));
  ASSERT_TRUE(store->deleteDocument(9, nullptr));
  expectFirstOfAll("two are gone behind the indexer's back");
}

TEST_F(IndexerTest, FreshnessCountsOnlyWithAWeight) {
  const double now = static_cast<double>(std::time(nullptr));
  ASSERT_EQ(add({mail("old", "word", "", now - 86400 * 400.0), mail("new", "word word", "", now)}),
            std::nullopt);
  TLQuery query;
  query.setOriginalQuery(u"word");
  query.setSearchParams(parameters(u"ranking.freshnessWeight=0.5"));
  const auto items = indexer->search(query, nullptr);
  ASSERT_EQ(items.size(), 2u);
  EXPECT_EQ(items[1]->card()->freshness(), -1.0);
  EXPECT_EQ(items[0]->card()->freshness(), 0.0);
  EXPECT_FLOAT_EQ(items[1]->card()->lightScore(), 0.9F - 0.5F);
  EXPECT_EQ(query.searchParams()->keyvaluesCount(), 30u);
}

TEST(Ranking, FreshnessPenaltyAndComparison) {
  const double day = 86400;
  const std::vector<std::pair<double, double>> ages{
      {-5, 0}, {0, 0}, {day, 0}, {3 * day, -1 / 7.52}, {366.2 * day, -1}, {1e9, -1}};
  for (const auto& [age, penalty] : ages) {
    EXPECT_NEAR(TALIndexer::_computeFreshnessPenalty(1e9, 1e9 + age), penalty, 1e-3) << age;
  }
  EXPECT_GT(TALIndexer::_computeFreshnessPenalty(0, 360 * day), -1.0);
  EXPECT_EQ(TALIndexer::_floatCompare(1, 1), 0);
  EXPECT_EQ(TALIndexer::_floatCompare(1, 2), -1);
  EXPECT_EQ(TALIndexer::_floatCompare(2, 1), 1);
  EXPECT_EQ(TALIndexer::_floatCompare(NAN, 1), 1);
  EXPECT_EQ(TALIndexer::_floatCompare(1, NAN), 1);
}

TEST_F(IndexerTest, SendingAgainAddsNothingAndAChangeIsFoundByItsNewWords) {
  ASSERT_EQ(add({mail("a", "first words", "some body")}), std::nullopt);
  const auto before = indexer->docStats();
  ASSERT_EQ(add({mail("a", "first words", "some body")}), std::nullopt);
  const auto after = indexer->docStats();
  EXPECT_EQ(before.at("TLDebugServiceSaltTotalSuffixes"),
            after.at("TLDebugServiceSaltTotalSuffixes"));
  EXPECT_EQ(after.at("TLDebugServiceDocStoreNumOfItems"), 1);
  ASSERT_EQ(add({mail("a", "changed words")}), std::nullopt);
  EXPECT_EQ(search("changed"), "a");
  EXPECT_EQ(indexer->docStats().at("TLDebugServiceTextStoreNumOfItems"), 1);
  EXPECT_EQ(indexer->docStats().size(), 18u);
}

TEST_F(IndexerTest, ARepeatedIdentifierInABatchIsOneDocumentMergedFromBoth) {
  auto second = std::make_shared<TLIndexableItem>();
  second->setIdentifier(u"a");
  second->addAttributeWithKeyStringValue(TEXT_CONTENT, u"later body");
  ASSERT_EQ(add({mail("a", "early subject", "replaced text"), second}), std::nullopt);
  EXPECT_EQ(search("early"), "a");
  EXPECT_EQ(search("later"), "a");
  EXPECT_EQ(search("replaced"), "");
  EXPECT_EQ(store->count(nullptr), 1);
  EXPECT_TRUE(log.contains("default TALIndexer: Indexed 1 docs in time:"));
}

TEST_F(IndexerTest, AnUpdateWithoutTextLeavesTheIndexUntouched) {
  ASSERT_EQ(add({mail("a", "subject")}), std::nullopt);
  const auto before = indexer->docStats();
  auto update = std::make_shared<TLIndexableItem>();
  update->setIdentifier(u"a");
  update->addAttributeWithKeyDoubleValue(MAIL_DATE_RECEIVED, 77);
  ASSERT_EQ(add({update}), std::nullopt);
  EXPECT_EQ(indexer->docStats().at("TLDebugServiceSaltIndexTimeSecs"),
            before.at("TLDebugServiceSaltIndexTimeSecs"));
  EXPECT_EQ(store->documentWithID(1, nullptr)->doubleValueForKey(MAIL_DATE_RECEIVED), 77);
  EXPECT_EQ(*store->documentWithID(1, nullptr)->stringValueForKey(SUBJECT), u"subject");
}

TEST_F(IndexerTest, HTMLPersonsAndListsGoToTheirZones) {
  auto item = std::make_shared<TLIndexableItem>();
  item->setIdentifier(u"a");
  item->addAttributeWithKeyBytesValue(HTML_CONTENT_DATA,
                                      "<p>Gr\xC3\xBC\xC3\x9F"
                                      "e <b>aus</b> Bern</p>");
  auto person = std::make_shared<TLPerson>();
  person->setName(u"Ada Lovelace");
  person->setEmailAddress(u"ada@example.org");
  item->addAttributeWithKeyPersonValues(AUTHORS, {{person}});
  item->addAttributeWithKeyStringValues(ATTACHMENT_NAMES, {{u"report_2024.pdf"}});
  item->addAttributeWithKeyStringValues(MAILBOXES, {{u"Inbox"}});
  item->addAttributeWithKeyStringValue(CONTENT_DESCRIPTION, u"unsearchable");
  ASSERT_EQ(add({item}), std::nullopt);
  for (const char* text : {"grusse aus bern", "lovelace", "ada example", "report", "2024"}) {
    EXPECT_EQ(search(text), "a") << text;
  }
  EXPECT_EQ(search("unsearchable"), "");
  EXPECT_EQ(search("inbox"), "");  // the zone is not searched for free text
  EXPECT_EQ(*store->documentWithID(1, nullptr)->stringValueForKey(CONTENT_SNIPPET),
            u"Gr\u00fc\u00dfe aus Bern");
}

TEST_F(IndexerTest, AnItemWithoutIdentifierStoresNothingOfTheBatch) {
  for (const char* bad : {"", "two words", "\xC3\xA9", "[x"}) {
    const Outcome error = add({mail("a", "word"), mail(bad, "My secret plan")});
    ASSERT_TRUE(error) << bad;
    EXPECT_EQ(*error, (TLError{"TALIndexer", 1, "document has no identifier"}));
  }
  EXPECT_EQ(store->count(nullptr), 0);
  EXPECT_TRUE(log.contains("subject: \"My...\"<14 chars>, docURL: (null)"));
  EXPECT_FALSE(log.contains("secret"));
}

TEST_F(IndexerTest, AZoneTooLargeFailsTheRestOfTheBatchAndSendingAgainRepairsIt) {
  const std::string tooLarge(200001, 'x');
  const Outcome error = add({mail("a", "word"), mail("b", "", tooLarge), mail("c", "word")});
  ASSERT_TRUE(error);
  EXPECT_EQ(*error, (TLError{"TALIndexer", 1, "index failed"}));
  EXPECT_TRUE(log.has("error SALT: Zone text too large."));
  EXPECT_TRUE(
      log.contains("Indexed 1 docs in SALT, aborting indexing of remaining 0 docs due to error"));
  EXPECT_EQ(search("word"), "a");
  EXPECT_EQ(add({mail("c", "word")}), std::nullopt);
  EXPECT_EQ(search("word"), "c a");
}

TEST_F(IndexerTest, ClientStateIsStoredOnlyAfterSuccessAndRemovedWithTheMail) {
  const auto combined = [&](TALIndexer::Items items, TALIndexer::Strings gone,
                            std::optional<std::string> state) {
    return testsupport::outcomeOf([&](auto done) {
      indexer->addDocs(std::move(items), std::move(gone), std::move(state), u"client",
                       "mail_bundle_id", done);
    });
  };
  const auto fetch = [&](const TLString& name) {
    std::optional<std::string> state;
    indexer->fetchLastClientStateforName(name,
                                         [&](const auto& value, const auto&) { state = value; });
    return state;
  };
  EXPECT_EQ(fetch(u"client"), std::nullopt);
  EXPECT_EQ(combined({mail("a", "word")}, {}, std::string("one\0two", 7)), std::nullopt);
  EXPECT_EQ(fetch(u"client"), std::string("one\0two", 7));
  EXPECT_TRUE(combined({mail("", "word")}, {}, "bad"));
  EXPECT_TRUE(combined({mail("b", "word")}, {u"nobody"}, "bad"));
  EXPECT_EQ(fetch(u"client"), std::string("one\0two", 7));
  EXPECT_EQ(search("word"), "a");
  EXPECT_EQ(combined({mail("b", "word")}, {u"a"}, std::nullopt), std::nullopt);
  EXPECT_EQ(search("word"), "b");
  EXPECT_EQ(fetch(u"client"), std::string("one\0two", 7));
  EXPECT_EQ(reset(), std::nullopt);
  EXPECT_EQ(fetch(u"client"), std::nullopt);
  EXPECT_EQ(search("word"), "");
  ASSERT_EQ(add({mail("b", "word")}), std::nullopt);
  EXPECT_EQ(search("word"), "b");
  EXPECT_EQ(store->documentIDWithURL(*TLURL::parse("tlw://mail_bundle_id/b"), nullptr), 1u);
}

TEST_F(IndexerTest, AStoreThatIsGoneEmptiesTheIndex) {
  ASSERT_EQ(add({mail("a", "word")}), std::nullopt);
  indexer->shutdown();
  ASSERT_TRUE(platform::removeItem(directory / "docstore", nullptr));
  open();
  EXPECT_EQ(search("word"), "");
  EXPECT_EQ(indexer->docStats().at("TLDebugServiceTextStoreNumOfItems"), 0);
  EXPECT_TRUE(log.has("default TALIndexer: SALT was reset"));
}

TEST_F(IndexerTest, AnIndexThatDoesNotOpenIsRecreatedAndEmptiesTheStore) {
  const std::string salt = directory / "salt";
  const std::function<void()> damages[] = {
      [&] { salttest::editMetrics(salt, [](auto& m) { m.CodeVersion = 303; }); },
      [&] { salttest::editMetrics(salt, [](auto& m) { m.Shards = 17; }); },
      [&] { platform::writeFileAtomically(salt + "/CURRENT", "garbage", nullptr); },
      [&] { platform::removeItem(salt, nullptr); },
  };
  for (const auto& damage : damages) {
    ASSERT_EQ(add({mail("a", "word")}), std::nullopt);
    indexer->shutdown();
    damage();
    log.clear();
    open();
    EXPECT_TRUE(
        log.has("default TALIndexer: Could not find path, creating new textstore at path " + salt));
    EXPECT_TRUE(log.contains("default TALIndexer: Reset docstore with "));
    EXPECT_EQ(store->count(nullptr), 0);
    EXPECT_EQ(search("word"), "");
    ASSERT_EQ(add({mail("b", "word")}), std::nullopt);
    EXPECT_EQ(search("word"), "b");
  }
}

TEST_F(IndexerTest, AFileInPlaceOfTheIndexIsKeptAndOperationsFail) {
  const std::string salt = directory / "salt";
  ASSERT_EQ(add({mail("a", "word")}), std::nullopt);
  indexer->shutdown();
  ASSERT_TRUE(platform::removeItem(salt, nullptr));
  ASSERT_TRUE(platform::writeFileAtomically(salt, "mine", nullptr));
  open();
  EXPECT_TRUE(log.contains("error TALIndexer: Could not create intermediate directory " + salt));
  EXPECT_EQ(search("word"), salt + ": File exists");
  ASSERT_TRUE(indexer->openingError());
  EXPECT_EQ(indexer->openingError()->code, EEXIST);
  EXPECT_EQ(add({mail("b", "word")}), indexer->openingError());
  EXPECT_TRUE(indexer->docStats().is_null());
  EXPECT_EQ(indexer->saltMetrics(), "");
  EXPECT_EQ(platform::readFile(salt, 100, nullptr), "mine");
  EXPECT_EQ(store->count(nullptr), 1);
  // Once the cause is gone, so is the error.
  ASSERT_TRUE(platform::removeItem(salt, nullptr));
  EXPECT_EQ(add({mail("b", "word")}), std::nullopt);
  EXPECT_EQ(search("word"), "b");
}

// Neither index nor store is lost when the system runs out of something.
TEST_F(IndexerTest, ATemporaryFailureToOpenKeepsTheMail) {
#ifdef __SANITIZE_ADDRESS__
  GTEST_SKIP() << "the sanitizer itself needs descriptors for its checks";
#endif
  ASSERT_EQ(add({mail("a", "word")}), std::nullopt);
  indexer->shutdown();
  rlimit before;
  ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &before), 0);
  // The store opens, but the index runs out of descriptors at one step after another.
  for (rlim_t most = 8; most < 40; ++most) {
    const rlimit few{most, before.rlim_max};
    ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &few), 0);
    open();
    ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &before), 0);
    indexer->shutdown();
  }
  open();
  EXPECT_EQ(indexer->openingError(), std::nullopt);
  EXPECT_EQ(search("word"), "a");
  EXPECT_TRUE(log.contains("Could not open the text index"));
}

TEST_F(IndexerTest, ADocumentMissingInTheStoreIsLeftOut) {
  ASSERT_EQ(add({mail("a", "word"), mail("b", "word")}), std::nullopt);
  ASSERT_TRUE(store->deleteDocument(1, nullptr));
  EXPECT_EQ(search("word"), "b");
  EXPECT_TRUE(
      log.contains("error TALIndexer: Internal docid 1 not found in docstore. Text score: 0.9"));
}

TEST_F(IndexerTest, AfterShutdownEveryOperationFails) {
  ASSERT_EQ(add({mail("a", "word")}), std::nullopt);
  indexer->shutdown();
  const TLError shuttingDown{"TALIndexer", 4, "shutting down"};
  EXPECT_EQ(add({mail("b", "word")}), shuttingDown);
  EXPECT_EQ(search("word"), "shutting down");
  EXPECT_TRUE(indexer->docStats().is_null());
  EXPECT_EQ(indexer->saltMetrics(), "");
  EXPECT_FALSE(indexer->iterateAllDocsToFindMatchingSubjects({u"word"}, nullptr));
}

TEST_F(IndexerTest, AnEmptyPathGivesAnIndexerWithoutIndex) {
  TALIndexer empty("", "class", store, "");
  EXPECT_TRUE(log.has("fault TALIndexer: No path specified for index."));
  EXPECT_TRUE(empty.docStats().is_null());
}

TEST_F(IndexerTest, StateIsCapturedFromTheQueue) {
  ASSERT_EQ(add({mail("a", "word")}), std::nullopt);
  const auto records = platform::captureState();
  ASSERT_EQ(records.size(), 1u);
  EXPECT_STREQ(records[0].c_str() + 136, "testing index stats");
  EXPECT_EQ(nlohmann::json::from_cbor(records[0].substr(200)),
            (nlohmann::json{{"DocStoreNumItems", 1}, {"SaltNumItems", 1}}));
}

TEST_F(IndexerTest, SubjectsAreFoundByReadingTheStore) {
  ASSERT_EQ(add({mail("a", "One"), mail("b", "Two"), mail("c", "One")}), std::nullopt);
  auto items = indexer->iterateAllDocsToFindMatchingSubjects({u"One"}, nullptr);
  ASSERT_TRUE(items);
  EXPECT_EQ(items->size(), 2u);
  EXPECT_TRUE(log.has("default TALIndexer: Verification Query Successful"));
  items = indexer->iterateAllDocsToFindMatchingSubjects({u"one", u"Two"}, nullptr);
  EXPECT_EQ(items->size(), 1u);
  EXPECT_TRUE(log.has(
      "default TALIndexer: [Linear Search] Subject with No Doc Match: <\"on...\"<3 chars>>"));
  EXPECT_TRUE(log.has("fault TALIndexer: Verification Query Failed"));
}

TEST_F(IndexerTest, SearchesAndStatisticsRunDuringIngest) {
  std::atomic<bool> done{false};
  std::thread reader([&] {
    while (!done) {
      search("word");
      search("wording ");  // modified, while batches run
      static_cast<void>(indexer->docStats());
      static_cast<void>(indexer->saltMetrics());
    }
  });
  for (int round = 0; round < 20; ++round) {
    TALIndexer::Items items;
    for (int i = 0; i < 10; ++i)
      items.push_back(mail(std::to_string(i), "word " + std::to_string(round)));
    ASSERT_EQ(add(items), std::nullopt);
    ASSERT_EQ(remove({u"0", u"5"}), std::nullopt);
    if (round == 10) {
      ASSERT_EQ(reset(), std::nullopt);
    }
  }
  done = true;
  reader.join();
  EXPECT_EQ(search("word 19"), "9 8 7 6 4 3 2 1");
}
