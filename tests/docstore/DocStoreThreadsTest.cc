#include <gtest/gtest.h>

#include <atomic>
#include <thread>

#include "docstore/TALSqliteDocStore.h"
#include "tests/docstore/DocStoreSupport.h"

using testsupport::item;
using testsupport::url;

TEST(DocStoreThreads, ReadersRunConcurrentlyWithAWriter) {
  TALSqliteDocStore store(":memory:");
  ASSERT_TRUE(store.openWithError(nullptr));
  constexpr size_t kDocuments = 300;
  std::atomic<bool> done = false;
  const auto read = [&] {
    do {
      const uint32_t docID = store.documentIDWithURL(url(1), nullptr);
      if (docID != 0) {
        EXPECT_EQ(testsupport::subjectOf(store.documentWithID(docID, nullptr)), u"s");
        EXPECT_EQ(store.documentsWithURLs({url(1)}, nullptr, nullptr).size(), 1U);
      }
      EXPECT_EQ(store.metadataValueForKey("version", nullptr), "v0.4");
      int64_t enumerated = 0;
      store.enumerateDocIDs(
          nullptr, [&](int64_t, uint32_t, const TLURL&, bool*, TLErrorOut) { ++enumerated; });
      EXPECT_LE(enumerated, store.count(nullptr));
      store.storeTopKVocab("vocab", nullptr);
      EXPECT_EQ(store.loadTopKVocab(nullptr), "vocab");
    } while (!done);
  };
  std::thread first(read);
  std::thread second(read);
  for (size_t i = 1; i <= kDocuments; ++i) {
    EXPECT_TRUE(store.storeOrUpdateDocuments({{url(i), item(u"s")}}, nullptr, nullptr));
    EXPECT_TRUE(store.storeOrUpdateDocuments(
        {{url(i), item(u"s")}}, {{url(i), static_cast<uint32_t>(i)}}, nullptr, nullptr));
    if (i % 100 == 0) {
      EXPECT_TRUE(store.vacuumWithError(nullptr));
    }
  }
  done = true;
  first.join();
  second.join();
  EXPECT_EQ(store.count(nullptr), static_cast<int64_t>(kDocuments));
}

TEST(DocStoreThreads, AnyOperationMayRunDuringClose) {
  TALSqliteDocStore store(":memory:");
  ASSERT_TRUE(store.openWithError(nullptr));
  ASSERT_TRUE(store.storeOrUpdateDocuments({{url(1), item(u"s")}}, nullptr, nullptr));
  std::atomic<bool> started = false;
  std::thread other([&] {
    do {
      store.storeTopKVocab("vocab", nullptr);
      started = true;
      started.notify_all();
    } while (store.documentIDWithURL(url(1), nullptr) == 1);
  });
  started.wait(false);
  store.close();
  other.join();
}
