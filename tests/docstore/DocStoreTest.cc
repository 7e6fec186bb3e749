#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>

#include "docstore/TALSqliteDocStore.h"
#include "tests/docstore/DocStoreSupport.h"
#include "tests/support/FileSizeLimit.h"
#include "tests/support/LogCapture.h"
#include "tests/support/SQLiteConnection.h"
#include "tests/support/TemporaryDirectory.h"

using testing::ElementsAre;
using testsupport::item;
using testsupport::LogCapture;
using testsupport::SQLiteConnection;
using testsupport::subjectOf;
using testsupport::TemporaryDirectory;
using testsupport::url;

namespace {

class DocStore : public testing::Test {
 protected:
  void SetUp() override { ASSERT_TRUE(_store.openWithError(nullptr)); }

  // Stores `count` documents with the URLs 1, 2, ... in this order.
  void fill(size_t count) {
    TLDocumentBatch batch;
    for (size_t i = 1; i <= count; ++i) batch.emplace_back(url(i), item(u"s"));
    ASSERT_TRUE(_store.storeOrUpdateDocuments(batch, nullptr, nullptr));
  }

  TemporaryDirectory _directory;
  const std::string _path = _directory / "deep/down/docs.sqlite";
  TALSqliteDocStore _store{_path};
};

}  // namespace

TEST_F(DocStore, VersionsDecideWhatAnOpenKeeps) {
  fill(3);
  ASSERT_TRUE(_store.setMetadataValue("state", "client", nullptr));
  _store.storeTopKVocab("vocab", nullptr);
  _store.close();
  LogCapture capture;
  {
    TALSqliteDocStore same(_path);
    ASSERT_TRUE(same.openWithError(nullptr));
    EXPECT_EQ(same.count(nullptr), 3);
    EXPECT_EQ(same.metadataValueForKey("version", nullptr), "v0.4");
    EXPECT_FALSE(capture.contains("incompatible"));
  }
  TALSqliteDocStore other(_path);
  ASSERT_TRUE(other.openWithError(nullptr, "v0.5"));
  EXPECT_TRUE(capture.has(
      "default TALSqliteDocStore: On disk docstore's version (v0.4) is incompatible with the new "
      "software (v0.5)."));
  EXPECT_TRUE(capture.has("default TALSqliteDocStore: Dropping docstore url index."));
  EXPECT_TRUE(capture.has("default TALSqliteDocStore: Dropping docstore table."));
  EXPECT_EQ(other.count(nullptr), 0);
  EXPECT_EQ(other.metadataValueForKey("client", nullptr), "state");
  EXPECT_EQ(other.metadataValueForKey("version", nullptr), "v0.5");
  EXPECT_EQ(other.loadTopKVocab(nullptr), "vocab");
  TLDocumentIDs ids;
  ASSERT_TRUE(other.storeOrUpdateDocuments({{url(9), item(u"s")}}, &ids, nullptr));
  EXPECT_EQ(ids.at(url(9)), 1U);

  TALSqliteDocStore fresh(":memory:");
  ASSERT_TRUE(fresh.openWithError(nullptr));
  EXPECT_TRUE(capture.contains("version ((null)) is incompatible with the new software (v0.4)."));
}

TEST(DocStoreOpen, FailuresAreReported) {
  TemporaryDirectory directory;
  std::ofstream(directory / "file") << "This text is long enough to be read as a header, surely.";
  std::filesystem::create_directory(directory / "folder");
  struct Case {
    std::string path;
    std::string domain;
    int code;
    std::string log;
  };
  const Case cases[] = {
      {directory / "file/below/docs", "POSIX", ENOTDIR, "Could not create intermediate directory"},
      {directory / "folder", "DocStore", SQLITE_CANTOPEN,
       "Failed to open database with error code 14"},
      {directory / "file", "DocStore", SQLITE_NOTADB, "Unable to prepare statement CREATE TABLE"},
  };
  for (const Case& one : cases) {
    LogCapture capture;
    TALSqliteDocStore store(one.path);
    std::optional<TLError> error;
    EXPECT_FALSE(store.openWithError(&error)) << one.path;
    ASSERT_TRUE(error) << one.path;
    EXPECT_EQ(error->domain, one.domain) << one.path;
    EXPECT_EQ(error->code, one.code) << one.path;
    EXPECT_TRUE(capture.contains(one.log)) << one.path;
    EXPECT_FALSE(store.setMetadataValue("v", "k", nullptr)) << "a failed open leaves it closed";
  }
}

TEST_F(DocStore, KeepsTheRetainedCopyOnly) {
  auto document = item(u"first");
  document->setDomainIdentifier(u"inbox");
  document->setExpirationDate(-5);
  document->addAttributeWithKeyStringValue(TLAttributeKey::TEXT_CONTENT, u"body");
  document->addAttributeWithKeyStringValue(TLAttributeKey::CUSTOM, u"own");
  document->addPersonsWithKey(TLAttributeKey::AUTHORS, {u"a@b"});
  document->addPersonsWithKey(TLAttributeKey::RECIPIENTS, {u"c@d", u"e@f"});
  document->addAttributeWithKeyDoubleValue(TLAttributeKey::MAIL_DATE_RECEIVED, 1.5);
  document->addAttributeWithKeyDoubleValue(TLAttributeKey::CONTENT_CREATION_DATE, 2.5);
  document->addAttributeWithKeyStringValue(TLAttributeKey::SUBJECT, u"second");
  document->addAttributeWithKeyStringValue(TLAttributeKey::CONTENT_SNIPPET, u"bo");
  document->setCard(std::make_shared<TLCard>());
  auto expected = document->copyWithZone();
  expected->setCard(nullptr);
  auto attributes = expected->attributes();
  attributes.erase(attributes.begin() + 1, attributes.begin() + 3);
  expected->setAttributes(attributes);

  TLDocumentIDs ids;
  auto anonymous = std::make_shared<TLIndexableItem>();
  anonymous->setIdentifier(std::nullopt);
  ASSERT_TRUE(
      _store.storeOrUpdateDocuments({{url(1), document}, {url(2), anonymous}}, &ids, nullptr));
  EXPECT_TRUE(_store.documentWithID(ids.at(url(1)), nullptr)->isEqual(*expected));
  EXPECT_TRUE(_store.documentWithURL(url(1), nullptr)->isEqual(*expected));
  EXPECT_EQ(SQLiteConnection(_path).ask("SELECT length(doc) FROM docstore WHERE docid = 2"), "0");
  EXPECT_EQ(_store.retainedAttributes().size(), 6U);
}

TEST_F(DocStore, MapsURLsAndIDs) {
  fill(2);
  std::optional<TLError> error;
  EXPECT_EQ(_store.documentIDWithURL(url(2), &error), 2U);
  EXPECT_EQ(_store.documentIDWithURL(url(3), &error), 0U);
  EXPECT_EQ(_store.urlWithID(1, &error), url(1));
  EXPECT_EQ(_store.urlWithID(3, &error), std::nullopt);
  EXPECT_EQ(_store.documentWithID(3, &error), nullptr);
  uint32_t docID = 77;
  EXPECT_EQ(_store.documentWithURL(url(3), &error, &docID), nullptr);
  EXPECT_EQ(docID, 77U);
  EXPECT_NE(_store.documentWithURL(url(2), &error, &docID), nullptr);
  EXPECT_EQ(docID, 2U);
  EXPECT_TRUE(_store.deleteDocument(2, &error));
  EXPECT_TRUE(_store.deleteDocument(2, &error));
  EXPECT_EQ(_store.documentIDWithURL(url(2), &error), 0U);
  EXPECT_TRUE(_store.deleteDocuments({1, 2, 3}, &error));
  EXPECT_EQ(_store.count(nullptr), 0);
  EXPECT_FALSE(error);
  TLDocumentIDs ids;
  ASSERT_TRUE(_store.storeOrUpdateDocuments({{url(2), item(u"s")}}, &ids, nullptr));
  EXPECT_EQ(ids.at(url(2)), 3U) << "an ID is not used again";
}

TEST_F(DocStore, AKnownURLFailsTheBatchOfNewDocuments) {
  fill(1);
  LogCapture capture;
  TLDocumentIDs ids;
  std::optional<TLError> error;
  EXPECT_FALSE(_store.storeOrUpdateDocuments(
      {{url(5), item(u"a")}, {url(1), item(u"b")}, {url(6), item(u"c")}}, &ids, &error));
  EXPECT_EQ(error, (TLError{"DocStore", 19, "UNIQUE constraint failed: docstore.url"}));
  EXPECT_THAT(ids, ElementsAre(testing::Pair(url(5), 2U)));
  EXPECT_EQ(_store.count(nullptr), 1);
  EXPECT_EQ(subjectOf(_store.documentWithURL(url(1), nullptr)), u"s");
  EXPECT_THAT(capture.lines(),
              ElementsAre("error TALSqliteDocStore: Unable to store or update document: DocStore "
                          "19: UNIQUE constraint failed: docstore.url"));
}

TEST_F(DocStore, UpdatesAtIDs) {
  fill(2);
  TLDocumentIDs ids;
  std::optional<TLError> error;
  const TLDocumentIDs at{{url(1), 1}, {url(2), 2}, {url(9), 9}};
  EXPECT_TRUE(_store.storeOrUpdateDocuments({{url(2), item(u"new")}, {url(9), item(u"none")}}, at,
                                            &ids, &error));
  EXPECT_EQ(ids, (TLDocumentIDs{{url(2), 2}, {url(9), 9}}));
  EXPECT_EQ(subjectOf(_store.documentWithURL(url(2), nullptr)), u"new");
  EXPECT_EQ(_store.documentWithID(9, nullptr), nullptr) << "an update makes no row";
  EXPECT_FALSE(error);
  EXPECT_FALSE(_store.storeOrUpdateDocuments({{url(1), item(u"x")}, {url(7), item(u"y")}}, at, &ids,
                                             &error));
  EXPECT_EQ(error, (TLError{"DocStore", 4, ""}));
  EXPECT_EQ(subjectOf(_store.documentWithURL(url(1), nullptr)), u"s") << "rolled back";
}

TEST_F(DocStore, LooksUpURLsInBatches) {
  fill(65);
  std::vector<TLURL> urls;
  for (size_t i = 0; i <= 66; ++i) urls.push_back(url(i));
  TLDocumentIDs ids;
  EXPECT_EQ(_store.documentsWithURLs(urls, nullptr, &ids).size(), 65U);
  EXPECT_EQ(ids.size(), 65U);
  EXPECT_EQ(ids.at(url(65)), 65U);
  EXPECT_TRUE(_store.documentsWithURLs({}, nullptr, nullptr).empty());

  const TLURL tooLong = url(std::string(100001 - url("").absoluteString().size(), 'x'));
  const TLURL longest = url(std::string(100000 - url("").absoluteString().size(), 'x'));
  ASSERT_EQ(tooLong.absoluteString().size(), 100001U);
  ASSERT_TRUE(_store.storeOrUpdateDocuments({{longest, item(u"s")}}, nullptr, nullptr));
  const auto found = [&](std::vector<TLURL> list) {
    return _store.documentsWithURLs(list, nullptr, nullptr).size();
  };
  EXPECT_EQ(found({tooLong, url(1)}), 0U);
  EXPECT_EQ(found({url(1), url(2), tooLong, url(3)}), 2U);
  EXPECT_EQ(found({url(1), longest, url(2)}), 3U);
}

TEST_F(DocStore, LooksUpIDsInChunks) {
  fill(10001);
  std::vector<uint32_t> ids{0, 20000};
  for (uint32_t i = 1; i <= 10001; ++i) ids.push_back(i);
  const auto items = _store.documentsWithIDs(ids, nullptr);
  EXPECT_EQ(items.size(), 10001U);
  EXPECT_TRUE(items.contains(10001));
  EXPECT_TRUE(_store.documentsWithIDs({}, nullptr).empty());
}

TEST_F(DocStore, EnumeratesNewestFirst) {
  size_t stored = 0;
  for (const size_t total : {0, 1023, 1024, 1025, 2048}) {
    TLDocumentBatch batch;
    while (stored < total) batch.emplace_back(url(++stored), item(u"s"));
    ASSERT_TRUE(_store.storeOrUpdateDocuments(batch, nullptr, nullptr));
    int64_t calls = 0;
    EXPECT_TRUE(_store.enumerateDocIDs(
        nullptr, [&](int64_t index, uint32_t docID, const TLURL& at, bool*, TLErrorOut) {
          ASSERT_EQ(index, calls++);
          ASSERT_EQ(docID, total - static_cast<size_t>(index));
          ASSERT_EQ(at, url(docID));
        }));
    EXPECT_EQ(calls, static_cast<int64_t>(total));
  }
  for (const int64_t last : {0, 1023, 1024, 2046}) {
    int64_t calls = 0;
    _store.enumerateDocIDs(
        nullptr, [&](int64_t index, uint32_t docID, const TLURL& at, bool* stop, TLErrorOut error) {
          ++calls;
          *stop = index == last;
          EXPECT_EQ(_store.urlWithID(docID, error), at) << "the handler may call the store";
        });
    EXPECT_EQ(calls, last + 1);
  }
}

TEST_F(DocStore, MetadataHoldsAnyBytes) {
  const std::string value("\0\xFF\x80 bytes\0", 10);
  std::optional<TLError> error;
  LogCapture capture;
  EXPECT_EQ(_store.metadataValueForKey("none", &error), std::nullopt);
  EXPECT_FALSE(error);
  EXPECT_TRUE(_store.setMetadataValue(value, "k'ey", nullptr));
  EXPECT_TRUE(_store.setMetadataValue("", "empty", nullptr));
  EXPECT_EQ(_store.metadataValueForKey("k'ey", nullptr), value);
  EXPECT_EQ(_store.metadataValueForKey("empty", nullptr), "");
  EXPECT_EQ(SQLiteConnection(_path).ask("SELECT typeof(value) FROM metadata WHERE key = 'k''ey'"),
            "text");
  EXPECT_TRUE(capture.has("debug TALSqliteDocStore: metadataValueForKey for key none"));
  EXPECT_TRUE(capture.has("debug TALSqliteDocStore: setMetadataValue for key k'ey"));
}

TEST_F(DocStore, TopKVocabularyIsOneRow) {
  LogCapture capture;
  EXPECT_EQ(_store.loadTopKVocab(nullptr), std::nullopt);
  _store.storeTopKVocab("one", nullptr);
  _store.storeTopKVocab(std::string("t\0o", 3), nullptr);
  EXPECT_EQ(_store.loadTopKVocab(nullptr), std::string("t\0o", 3));
  EXPECT_EQ(SQLiteConnection(_path).ask("SELECT count(*) FROM topkvocab"), "1");
  EXPECT_THAT(capture.lines(),
              ElementsAre("debug TALSqliteDocStore: Starting to load TopK vocab.",
                          "debug TALSqliteDocStore: No data loaded from table topkvocab",
                          "debug TALSqliteDocStore: Starting to store TopK vocab.",
                          "debug TALSqliteDocStore: Successfully stored TopK vocab.",
                          "debug TALSqliteDocStore: Starting to store TopK vocab.",
                          "debug TALSqliteDocStore: Successfully stored TopK vocab.",
                          "debug TALSqliteDocStore: Starting to load TopK vocab.",
                          "debug TALSqliteDocStore: Successfully loaded TopK vocab."));
}

TEST_F(DocStore, ResetKeepsTheVersionOnly) {
  fill(3);
  ASSERT_TRUE(_store.setMetadataValue("state", "client", nullptr));
  _store.storeTopKVocab("vocab", nullptr);
  EXPECT_TRUE(_store.resetWithError(nullptr));
  EXPECT_EQ(_store.count(nullptr), 0);
  EXPECT_EQ(_store.metadataValueForKey("client", nullptr), std::nullopt);
  EXPECT_EQ(_store.metadataValueForKey("version", nullptr), "v0.4");
  EXPECT_EQ(_store.loadTopKVocab(nullptr), std::nullopt);
  fill(1);
  EXPECT_EQ(_store.documentIDWithURL(url(1), nullptr), 1U);
}

TEST_F(DocStore, ALockedDatabaseFailsWritesAndStillReads) {
  fill(2);
  SQLiteConnection other(_path);
  other.run("BEGIN IMMEDIATE");
  LogCapture capture;
  std::optional<TLError> error;
  EXPECT_TRUE(_store.vacuumWithError(&error));
  EXPECT_EQ(error, (TLError{"DocStore", SQLITE_BUSY, "database is locked"}));
  EXPECT_TRUE(
      capture.has("error TALSqliteDocStore: Unable to step statement  VACUUM;: DocStore 5: "
                  "database is locked"));
  capture.clear();
  error.reset();
  EXPECT_FALSE(_store.storeOrUpdateDocuments({{url(3), item(u"s")}}, nullptr, &error));
  EXPECT_EQ(error, (TLError{"DocStore", SQLITE_BUSY, "database is locked"}));
  EXPECT_THAT(
      capture.lines(),
      ElementsAre("error TALSqliteDocStore: Unable to step statement: DocStore 5: database is "
                  "locked",
                  "error TALSqliteDocStore: Unable to begin immediate transaction: DocStore 5: "
                  "database is locked",
                  "error TALSqliteDocStore: Unable to step statement: DocStore 1: cannot rollback "
                  "- no transaction is active",
                  "error TALSqliteDocStore: Unable to rollback transaction after commit failed: "
                  "DocStore 1: cannot rollback - no transaction is active"));
  capture.clear();
  EXPECT_FALSE(_store.deleteDocument(1, nullptr));
  EXPECT_FALSE(_store.deleteDocuments({1, 2}, nullptr));
  EXPECT_FALSE(_store.setMetadataValue("v", "k", nullptr));
  EXPECT_FALSE(_store.resetWithError(nullptr));
  EXPECT_TRUE(
      capture.has("error TALSqliteDocStore: Unable to commit DocStore 5: database is locked"));
  EXPECT_TRUE(capture.has(
      "error TALSqliteDocStore: Unable to set value for key k: DocStore 5: database is locked"));
  EXPECT_EQ(_store.count(nullptr), 2);
  other.run("COMMIT");
  EXPECT_TRUE(_store.storeOrUpdateDocuments({{url(3), item(u"s")}}, nullptr, nullptr));
  error.reset();
  EXPECT_TRUE(_store.vacuumWithError(&error));
  EXPECT_FALSE(error);
  EXPECT_EQ(_store.count(nullptr), 3);
}

TEST_F(DocStore, AFailedCommitIsReportedByTheErrorOnly) {
  fill(1);
  // The write-ahead log cannot grow from here on.
  LogCapture capture;
  {
    const testsupport::FileSizeLimit limit(std::filesystem::file_size(_path + "-wal"));
    std::optional<TLError> error;
    EXPECT_TRUE(_store.storeOrUpdateDocuments({{url(2), item(u"s")}}, nullptr, &error));
    EXPECT_TRUE(error);
  }
  EXPECT_TRUE(capture.contains("error TALSqliteDocStore: Unable to commit transaction: DocStore"));
  EXPECT_EQ(_store.count(nullptr), 1);
  EXPECT_TRUE(_store.storeOrUpdateDocuments({{url(2), item(u"s")}}, nullptr, nullptr));
  EXPECT_EQ(_store.count(nullptr), 2);
}

TEST_F(DocStore, DamagedAndMissingItems) {
  fill(3);
  SQLiteConnection other(_path);
  other.run("UPDATE docstore SET doc = NULL WHERE docid = 1");
  other.run("UPDATE docstore SET doc = x'0AFF' WHERE docid = 2");
  other.run("UPDATE docstore SET url = 'no url' WHERE docid = 3");
  LogCapture capture;
  EXPECT_TRUE(_store.documentWithID(1, nullptr)->isEqual(TLIndexableItem()));
  EXPECT_TRUE(capture.lines().empty());
  TLDocumentIDs ids;
  EXPECT_EQ(_store.documentsWithURLs({url(1), url(2), url(3)}, nullptr, &ids).size(), 2U);
  EXPECT_EQ(ids.at(url(2)), 2U);
  EXPECT_EQ(capture.count("error TALSqliteDocStore: A stored document is damaged"), 1U);
  EXPECT_EQ(_store.urlWithID(3, nullptr), std::nullopt);
  EXPECT_EQ(_store.countWithoutDocBlob(nullptr), 1);
  EXPECT_EQ(_store.countWithoutHtmlBlob(nullptr), 3);
  EXPECT_EQ(_store.count(nullptr), 3);
  std::vector<uint32_t> seen;
  _store.enumerateDocIDs(nullptr, [&](int64_t, uint32_t docID, const TLURL&, bool*, TLErrorOut) {
    seen.push_back(docID);
  });
  EXPECT_THAT(seen, ElementsAre(2U, 1U));
}

TEST_F(DocStore, AClosedStoreRefusesOperations) {
  fill(1);
  LogCapture capture;
  _store.close();
  _store.close();
  EXPECT_THAT(capture.lines(),
              ElementsAre("default TALSqliteDocStore: Closing database connection",
                          "default TALSqliteDocStore: Closed database connection"));
  const TLError noConnection{"DocStore", 1001, ""};
  const auto fails = [&](const auto& write) {
    std::optional<TLError> error;
    return !write(&error) && error == noConnection;
  };
  const TLDocumentBatch batch{{url(2), item(u"s")}};
  EXPECT_TRUE(fails([&](auto e) { return _store.setMetadataValue("v", "k", e); }));
  EXPECT_TRUE(fails([&](auto e) { return _store.storeOrUpdateDocuments(batch, nullptr, e); }));
  EXPECT_TRUE(fails([&](auto e) { return _store.storeOrUpdateDocuments(batch, {}, nullptr, e); }));
  EXPECT_TRUE(fails([&](auto e) { return _store.deleteDocument(1, e); }));
  EXPECT_TRUE(fails([&](auto e) { return _store.deleteDocuments({1}, e); }));
  EXPECT_TRUE(fails([&](auto e) { return _store.resetWithError(e); }));
  EXPECT_TRUE(fails([&](auto e) { return _store.documentIDWithURL(url(1), e) != 0; }));
  EXPECT_TRUE(fails([&](auto e) { return _store.metadataValueForKey("version", e).has_value(); }));
  EXPECT_TRUE(_store.vacuumWithError(nullptr));
  EXPECT_EQ(_store.urlWithID(1, nullptr), std::nullopt);
  EXPECT_EQ(_store.documentWithID(1, nullptr), nullptr);
  EXPECT_TRUE(_store.documentsWithIDs({1}, nullptr).empty());
  EXPECT_EQ(_store.documentWithURL(url(1), nullptr), nullptr);
  EXPECT_EQ(_store.count(nullptr), 0);
  EXPECT_TRUE(_store.enumerateDocIDs(
      nullptr, [](int64_t, uint32_t, const TLURL&, bool*, TLErrorOut) { FAIL(); }));
  _store.storeTopKVocab("v", nullptr);
  EXPECT_EQ(_store.loadTopKVocab(nullptr), std::nullopt);
}
