#include <gtest/gtest.h>

#include "daemon/TALSearchService.h"
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
