#include "tests/indexer/IndexerSupport.h"
#include "tests/support/SQLiteConnection.h"

using testsupport::IndexerTest;
using testsupport::mail;

TEST_F(IndexerTest, AnUnknownIdentifierEndsTheListOfDeletions) {
  TALIndexer::Items items{mail("b", "word")};
  TALIndexer::Strings identifiers;
  for (int i = 0; i < 150; ++i) {
    items.push_back(mail(std::to_string(i), "word"));
    identifiers.push_back(*items.back()->identifier());
  }
  ASSERT_EQ(add(items), std::nullopt);
  identifiers.insert(identifiers.end(), {u"nobody", u"b"});
  const testsupport::Outcome error = remove(identifiers);
  ASSERT_TRUE(error);
  EXPECT_EQ(error->domain, "DocStore");
  EXPECT_TRUE(
      log.contains("Failed to fetch document ID in docstore for URL tlw://mail_bundle_id/nobody"));
  EXPECT_EQ(search("word"), "b");
  EXPECT_TRUE(remove({u""}));
  // The second time it is not there any more.
  EXPECT_TRUE(remove({u"b", u"b"}));
  EXPECT_EQ(store->count(nullptr), 0);
}

TEST_F(IndexerTest, DeletesByDomain) {
  TALIndexer::Items items;
  for (int i = 0; i < 206; ++i) {
    items.push_back(mail(std::to_string(i), "word"));
    items.back()->setDomainIdentifier(i % 2 == 0 || i > 5 ? u"even" : u"odd");
  }
  items.push_back(mail("other", "word"));
  items.back()->setDomainIdentifier(u"third");
  items.push_back(mail("none", "word"));
  ASSERT_EQ(add(items), std::nullopt);
  EXPECT_EQ(testsupport::outcomeOf([&](auto done) {
              indexer->deleteItemsByDomainIdentifiers({u"even", u"nothing", u"third"}, done);
            }),
            std::nullopt);
  EXPECT_EQ(search("word"), "none 5 3 1");
  EXPECT_EQ(store->count(nullptr), 4);
}

// A trigger of the database makes one deletion fail, in the middle of what goes into one
// transaction.
TEST_F(IndexerTest, ADeletionThatFailsEndsTheListAndThoseBeforeItStand) {
  ASSERT_EQ(add({mail("a", "word"), mail("b", "word"), mail("c", "word"), mail("d", "word")}),
            std::nullopt);
  testsupport::SQLiteConnection(directory / "docstore/docstore.db")
      .run(
          "CREATE TRIGGER keep BEFORE DELETE ON docstore WHEN old.docid = 3 "
          "BEGIN SELECT RAISE(ABORT, 'kept'); END");
  const auto failure = remove({u"a", u"b", u"c", u"d"});
  ASSERT_TRUE(failure.has_value());
  EXPECT_EQ(failure->domain, "DocStore");
  EXPECT_EQ(search("word"), "d c");
  EXPECT_TRUE(log.contains("Failed to delete document with ID 3 in docstore: "));
}
