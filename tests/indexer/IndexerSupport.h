#pragma once

#include <gtest/gtest.h>

#include "docstore/TALSqliteDocStore.h"
#include "indexer/TALIndexer.h"
#include "tests/support/LogCapture.h"
#include "tests/support/Outcome.h"
#include "tests/support/TemporaryDirectory.h"

namespace testsupport {

inline std::shared_ptr<TLIndexableItem> mail(const std::string& identifier,
                                             const std::string& subject,
                                             const std::string& body = "", double date = 0) {
  auto item = std::make_shared<TLIndexableItem>();
  item->setIdentifier(platform::fromUTF8(identifier));
  item->addAttributeWithKeyStringValue(TLAttributeKey::SUBJECT, platform::fromUTF8(subject));
  if (!body.empty())
    item->addAttributeWithKeyStringValue(TLAttributeKey::TEXT_CONTENT, platform::fromUTF8(body));
  if (date != 0) item->addAttributeWithKeyDoubleValue(TLAttributeKey::MAIL_DATE_RECEIVED, date);
  return item;
}

// An indexer with a store of its own.
class IndexerTest : public testing::Test {
 protected:
  IndexerTest() { open(); }
  ~IndexerTest() override {
    if (indexer != nullptr) indexer->shutdown();
  }

  void open() {
    store = std::make_shared<TALSqliteDocStore>(directory / "docstore/docstore.db");
    ASSERT_TRUE(store->openWithError(nullptr));
    indexer = std::make_unique<TALIndexer>(directory / "salt", "testing", store,
                                           directory / "synonyms.txt");
  }
  void reopen() {
    indexer->shutdown();
    indexer.reset();
    open();
  }

  Outcome add(TALIndexer::Items items) {
    return outcomeOf(
        [&](auto done) { indexer->addDocs(std::move(items), "mail_bundle_id", done); });
  }
  Outcome remove(TALIndexer::Strings identifiers) {
    return outcomeOf([&](auto done) {
      indexer->deleteItemsByIdentifiers(std::move(identifiers), "mail_bundle_id", done);
    });
  }

  Outcome reset() {
    return outcomeOf([&](auto done) { indexer->resetWithCompletionHandler(done); });
  }

  // Identifiers of the results, in order, separated by spaces; on failure the error message.
  std::string search(const std::string& text, std::shared_ptr<TLParameters> overrides = nullptr) {
    TLQuery query;
    query.setOriginalQuery(platform::fromUTF8(text));
    query.setSearchParams(std::move(overrides));
    Outcome error;
    const auto items = indexer->search(query, &error);
    if (error) return error->message;
    std::string out;
    for (const auto& item : items) {
      if (!out.empty()) out += ' ';
      out += platform::printable(item->identifier());
    }
    return out;
  }

  LogCapture log;
  TemporaryDirectory directory;
  std::shared_ptr<TALSqliteDocStore> store;
  std::unique_ptr<TALIndexer> indexer;
};

}  // namespace testsupport
