#include <gtest/gtest.h>

#include "daemon/TALSearchService.h"
#include "daemon/VerificationQuery.h"
#include "parameters/TLParamsManager.h"
#include "platform/Files.h"
#include "platform/Signpost.h"
#include "tests/support/LogCapture.h"
#include "tests/support/Outcome.h"
#include "tests/support/TemporaryDirectory.h"

namespace {

using testsupport::Outcome;
using testsupport::outcomeOf;
using Items = TALSearchService::Items;

std::shared_ptr<TLIndexableItem> mail(const TLString& identifier, const TLString& subject) {
  auto item = std::make_shared<TLIndexableItem>();
  item->setIdentifier(identifier);
  item->addAttributeWithKeyStringValue(TLAttributeKey::SUBJECT, subject);
  return item;
}

std::shared_ptr<TLQuery> textQuery(const TLString& text) {
  auto query = std::make_shared<TLQuery>();
  query->setRawQuery(text);
  query->setOriginalQuery(text);
  return query;
}

// A query as a mail client sends it to check whether it has messages with these subjects.
std::shared_ptr<TLQuery> verificationQuery(const std::vector<TLString>& subjects) {
  auto query = std::make_shared<TLQuery>();
  auto root = std::make_shared<TLQueryNode>();
  root->setMergeOp(TLQueryNodeMergeOp::OR);
  TLString raw = u"(";
  for (const TLString& subject : subjects) {
    auto leaf = std::make_shared<TLQueryNode>();
    leaf->addKey(TLAttributeKey::SUBJECT);
    leaf->setStringValue(subject);
    root->addChild(leaf);
    if (raw.size() > 1) raw += u" || ";
    raw += u"kTLItemSubject = '" + subject + u"'";
  }
  query->setRoot(root);
  query->setRawQuery(raw + u")");
  return query;
}

class SearchServiceTest : public testing::Test {
 protected:
  SearchServiceTest()
      : service(std::make_shared<TALIndexerManager>(
            directory.path(), [this] { return lock; },
            [this](const std::string&) { return freeBytes; })) {}
  ~SearchServiceTest() override { service.shutdown(); }

  Outcome index(Items items, const std::string& protectionClass = "default") {
    return outcomeOf(
        [&](auto reply) { service.indexItems(std::move(items), "test", protectionClass, reply); });
  }
  // The number of results, or -1 with `lastError` set.
  int search(const std::shared_ptr<TLQuery>& query, int64_t maximum = 100,
             const std::string& protectionClass = "default") {
    int count = -2;
    service.searchItemsForQuery(*query, 1, protectionClass, maximum,
                                [&](const std::optional<Items>& items, const Outcome& error) {
                                  lastError = error;
                                  count = error ? -1 : static_cast<int>(items->size());
                                });
    return count;
  }

  testsupport::LogCapture log;
  testsupport::TemporaryDirectory directory;
  TALIndexerManager::LockState lock{true, true};
  uint64_t freeBytes = 1 << 30;
  TALSearchService service;
  Outcome lastError;
};

}  // namespace

TEST_F(SearchServiceTest, LogsItsRequestsAndNeverPersonalText) {
  ASSERT_EQ(index({mail(u"a", u"private words")}), std::nullopt);
  EXPECT_TRUE(
      log.has("default TALSearchService: Requested indexItems numDocuments=1, callerName=test, "
              "protectionClass=default"));
  EXPECT_EQ(search(textQuery(u"private words")), 1);
  EXPECT_TRUE(
      log.has("default TALSearchService: Requested searchItemsForQuery query=\"pr...\"<13 chars>, "
              "context=<maxResults=100, options=TLSearchOptionTopHit>, protectionClass=default"));
  EXPECT_TRUE(log.contains("results=1, timeTaken="));
  EXPECT_FALSE(log.contains("private"));
  // The log line of a completion follows its reply; shutdown waits for it.
  service.shutdown();
  EXPECT_TRUE(
      log.contains("default TALSearchService: Finished indexItems numDocuments=1, callerName=test, "
                   "protectionClass=default, timeTaken="));
  EXPECT_TRUE(log.has("default TALSearchService: SearchService has shut down"));
}

TEST_F(SearchServiceTest, LogsEmptyFieldsAndMaxima) {
  EXPECT_EQ(TALSearchService::cleanName(""), "<empty>");
  EXPECT_EQ(TALSearchService::cleanProtectionClass("x"), "x");
  EXPECT_EQ(TALSearchService::_searchDescriptionWithOptions(0, INT64_MAX),
            "<maxResults=SysIntegerMax, options=TLSearchOptionNone>");
  EXPECT_EQ(TALSearchService::_searchDescriptionWithOptions(3, -4),
            "<maxResults=-4, options=TLSearchOptionTopHit>");
}

TEST_F(SearchServiceTest, MaximumTruncatesAndANegativeOneDoesNot) {
  ASSERT_EQ(index({mail(u"a", u"x"), mail(u"b", u"x"), mail(u"c", u"x")}), std::nullopt);
  for (const auto& [maximum, count] :
       std::vector<std::pair<int64_t, int>>{{2, 2}, {0, 0}, {-1, 3}}) {
    EXPECT_EQ(search(textQuery(u"x"), maximum), count) << maximum;
  }
}

TEST_F(SearchServiceTest, LockStateDecidesWhichClassesAreAccessible) {
  ASSERT_EQ(index({mail(u"a", u"x")}, "SysFileProtectionComplete"), std::nullopt);
  lock.protectedDataAvailable = false;
  const TLError unavailable = TALIndexerManager::indexerUnavailableError();
  EXPECT_EQ(unavailable,
            (TLError{"com.quill.tallow.TALIndexerManager", -2, "Indexer unavailable."}));
  EXPECT_EQ(index({mail(u"b", u"x")}, "SysFileProtectionComplete"), unavailable);
  EXPECT_TRUE(
      log.has("error TALIndexerManager: Not providing an SysFileProtectionComplete indexer without "
              "protected data available."));
  EXPECT_EQ(index({mail(u"b", u"x")}, "other"), std::nullopt);
  lock.unlockedSinceBoot = false;
  EXPECT_EQ(search(textQuery(u"x"), 10, "other"), -1);
  EXPECT_EQ(lastError, unavailable);
  EXPECT_TRUE(
      log.has("error TALIndexerManager: Not providing a requested other indexer prior to first "
              "unlock."));
  lock = {true, true};
  EXPECT_EQ(search(textQuery(u"x"), 10, "other"), 1);
  EXPECT_EQ(search(textQuery(u"x"), 10, "SysFileProtectionComplete"), 1);
  EXPECT_TRUE(platform::fileExists(directory / "other/docstore/docstore.db"));
  EXPECT_TRUE(platform::fileExists(directory / "SysFileProtectionComplete/salt/CURRENT"));
}

TEST_F(SearchServiceTest, AClassMustNameOneDirectory) {
  const std::vector<std::string> bad{
      "", ".", "..", "../x", "a/b", "/etc", std::string("a\0b", 3), std::string(256, 'c')};
  for (const std::string& name : bad) {
    EXPECT_TRUE(index({mail(u"a", u"x")}, name)) << name;
    EXPECT_EQ(search(textQuery(u"x"), 1, name), -1);
  }
  EXPECT_EQ(log.count("fault TALIndexerManager: Could not create"), 2 * bad.size());
  EXPECT_TRUE(platform::listDirectory(directory.path(), nullptr)->empty());
  for (const char* good : {"...", "a b", "\xC3\xA9", "-x", "*"}) {
    EXPECT_EQ(index({mail(u"a", u"x")}, good), std::nullopt) << good;
  }
}

TEST_F(SearchServiceTest, AFailedStoreOpenIsTriedAgain) {
  ASSERT_TRUE(platform::createDirectories(directory / "default/docstore/docstore.db", nullptr));
  EXPECT_TRUE(index({mail(u"a", u"x")}));
  EXPECT_TRUE(log.contains("error TALIndexerManager: Could not create doc store in"));
  ASSERT_TRUE(platform::removeItem(directory / "default/docstore", nullptr));
  EXPECT_EQ(index({mail(u"a", u"x")}), std::nullopt);
}

TEST_F(SearchServiceTest, OnAFullDiskAnOpenClassWorksAndNoOtherIsOpened) {
  ASSERT_EQ(index({mail(u"a", u"x")}), std::nullopt);
  freeBytes = 0;
  EXPECT_EQ(search(textQuery(u"x")), 1);
  const Outcome refused = index({mail(u"a", u"x")}, "other");
  ASSERT_TRUE(refused);
  EXPECT_EQ(refused->code, ENOSPC);
  EXPECT_TRUE(log.contains("other: 0 bytes are left on the disk"));
  EXPECT_TRUE(platform::listDirectory(directory / "other", nullptr)->empty());
  freeBytes = 1 << 30;
  EXPECT_EQ(index({mail(u"a", u"x")}, "other"), std::nullopt);
}

TEST_F(SearchServiceTest, StatisticsStateVacuumAndReset) {
  ASSERT_EQ(outcomeOf([&](auto reply) {
              service.indexItems({mail(u"a", u"x")}, {}, "state", "client", "default", reply);
            }),
            std::nullopt);
  std::optional<std::string> state;
  service.fetchLastClientStateFromIndexerNamed(
      "client", "default", [&](const auto& value, const auto&) { state = value; });
  EXPECT_EQ(state, "state");
  nlohmann::json stats;
  service.fetchStatsForIndexerNamed("n", "default",
                                    [&](const auto& value, const auto&) { stats = value; });
  EXPECT_EQ(stats.at("TLDebugServiceDocStoreNumOfItems"), 1);
  std::string metrics;
  service.fetchStatsForSaltNamed("n", "default",
                                 [&](const auto& value, const auto&) { metrics = *value; });
  EXPECT_NE(metrics.find("SALT INDEX METRICS\n"), std::string::npos);
  EXPECT_EQ(outcomeOf([&](auto reply) {
              service.forceVacuumAndCompactForProtectionClass("default", reply);
            }),
            std::nullopt);
  EXPECT_EQ(outcomeOf([&](auto reply) {
              service.deleteItemsWithIdentifiers({u"a"}, "n", "default", reply);
            }),
            std::nullopt);
  EXPECT_EQ(outcomeOf([&](auto reply) {
              service.deleteItemsWithDomainIdentifiers({u"d"}, "n", "default", reply);
            }),
            std::nullopt);
  EXPECT_EQ(
      outcomeOf([&](auto reply) { service.deleteAllItemsFromIndexerNamed("n", "default", reply); }),
      std::nullopt);
  std::string answer;
  service.ping("hello", [&](const std::string& text) { answer = text; });
  EXPECT_EQ(answer.substr(0, 20), "Received hello\nCmd: ");
  EXPECT_NE(answer.find("Persistent path: " + directory.path() + "\n"), std::string::npos);
}

TEST_F(SearchServiceTest, AfterShutdownNoReplyIsCalled) {
  service.shutdown();
  EXPECT_EQ(search(textQuery(u"x")), -2);
  service.indexItems({mail(u"a", u"x")}, "n", "default", [](const Outcome&) { FAIL(); });
}

TEST_F(SearchServiceTest, EndSignpostHasTheCount) {
  std::vector<std::string> events;
  ASSERT_EQ(index({mail(u"a", u"secret")}), std::nullopt);
  platform::setSignpostSink([&](const platform::SignpostEvent& event) {
    events.push_back(fmt::format("{}:{}", event.name, event.message));
  });
  search(textQuery(u"secret"));
  platform::setSignpostSink({});
  ASSERT_GE(events.size(), 2u);
  EXPECT_EQ(events.front(), "SearchQuery:query secret");
  EXPECT_EQ(events.back(), "SearchQuery:query \"se...\"<6 chars> found 1 items");
}

TEST(VerificationQuery, IsRecognisedByItsShape) {
  EXPECT_FALSE(isMailVerificationQuery(nullptr));
  const std::vector<TLString> five{u"a", u"b", u"c", u"d", u"e"};
  const TLQuery query;
  EXPECT_FALSE(isMailVerificationQuery(&query));
  const auto good = verificationQuery(five);
  EXPECT_TRUE(isMailVerificationQuery(good.get()));
  const auto four = verificationQuery({u"a", u"b", u"c", u"d"});
  EXPECT_FALSE(isMailVerificationQuery(four.get()));
  using Change = std::function<void(TLQueryNode&)>;
  const std::vector<Change> changes{
      [](TLQueryNode& root) { root.setMergeOp(TLQueryNodeMergeOp::AND); },
      [](TLQueryNode& root) { root.childAtIndex(4)->addKey(TLAttributeKey::SUBJECT); },
      [](TLQueryNode& root) { root.childAtIndex(3)->clearKeys(); },
      [](TLQueryNode& root) { root.childAtIndex(2)->setOp(TLQueryNodeOp::STRING_NOT_EQUAL); },
      [](TLQueryNode& root) { root.childAtIndex(0)->setMergeOp(TLQueryNodeMergeOp::OR); }};
  for (const Change& change : changes) {
    const auto changed = verificationQuery(five);
    change(*changed->root());
    EXPECT_FALSE(isMailVerificationQuery(changed.get()));
  }
}

TEST(VerificationQuery, SubjectsComeFromTheText) {
  using Strings = std::vector<TLString>;
  const std::vector<std::pair<TLString, Strings>> cases{
      {u"", {}},
      {u"(kTLItemSubject = 'one' || kTLItemSubject = 'two')", {u"one", u"two"}},
      {u"kTLItemSubject = 'a\\'b' || kTLItemSubject = '\\\"q\\\" \\*'", {u"a'b", u"\"q\" *"}},
      {u"kTLItemSubject = '\\\\\\'x'", {u"\\'x"}},
      // An escaped backslash before an apostrophe is unescaped twice.
      {u"kTLItemSubject = 'a\\\\'b'", {u"a'b"}},
      {u"kTLItemSubject = 'x' || other = 'y' || kTLItemSubject = ''", {u"x"}},
      {u"((kTLItemSubject = '\u65e5\u672c'))", {u"\u65e5\u672c"}},
  };
  for (const auto& [raw, subjects] : cases) {
    EXPECT_EQ(subjectsFromRawQuery(raw), subjects) << platform::toUTF8(raw);
  }
}

TEST_F(SearchServiceTest, VerificationFindsExactSubjectsByBothPaths) {
  std::vector<TLString> subjects;
  Items items;
  for (const char16_t* subject :
       {u"Lunch", u"Lunch today", u"Re: Lunch", u"Invoice 7", u"Party", u"lunch"}) {
    items.push_back(mail(u"id" + platform::fromUTF8(std::to_string(items.size())), subject));
    if (items.size() < 6) subjects.push_back(subject);
  }
  ASSERT_EQ(index(items), std::nullopt);
  EXPECT_EQ(search(verificationQuery(subjects), 1), 5);
  EXPECT_TRUE(log.has("default TALSearchService: Verification Query Successful"));
  EXPECT_TRUE(log.contains("Doc with No Subject Match: <\"lu...\"<5 chars>>"));
  subjects[4] = u"Nobody wrote this";
  EXPECT_EQ(search(verificationQuery(subjects)), 4);
  EXPECT_TRUE(log.has("fault TALIndexer: Verification Query Failed"));
  // A number of results that reaches the limit cannot be trusted.
  subjects[4] = u"Party";
  const auto limited = verificationQuery(subjects);
  limited->setSearchParams(TLParamsManager::paramsFromString(u"salt.maxTopK=6"));
  log.clear();
  EXPECT_EQ(search(limited), 5);
  EXPECT_TRUE(log.contains("(max_limit = 6), will use a slow linear search"));
}
