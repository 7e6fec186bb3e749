#include <gtest/gtest.h>

#include <algorithm>
#include <future>

#include "docstore/TALSqliteDocStore.h"
#include "indexer/TALIndexer.h"
#include "parameters/TLParamsManager.h"
#include "platform/Files.h"
#include "tests/support/LogCapture.h"
#include "tests/support/Outcome.h"
#include "tests/support/TemporaryDirectory.h"

namespace {

// An indexer with three mails and its own synonyms.
class QueryModification : public testing::Test {
 protected:
  QueryModification() {
    EXPECT_TRUE(
        platform::writeFileAtomically(synonyms, "bill,invoice\nshipping,invoice\n", nullptr));
    EXPECT_TRUE(store->openWithError(nullptr));
    indexer = std::make_unique<TALIndexer>(directory / "salt", "testing", store, synonyms);
    EXPECT_EQ(testsupport::outcomeOf([this](auto done) {
                indexer->addDocs(
                    {mail(u"a", u"your invoice of june"), mail(u"b", u"orders shipped in june"),
                     mail(u"c", u"the billing address")},
                    "bundle", done);
              }),
              std::nullopt);
    log.clear();
  }
  ~QueryModification() override { indexer->shutdown(); }

  static std::shared_ptr<TLIndexableItem> mail(const TLString& identifier,
                                               const TLString& subject) {
    auto item = std::make_shared<TLIndexableItem>();
    item->setIdentifier(identifier);
    item->addAttributeWithKeyStringValue(TLAttributeKey::SUBJECT, subject);
    return item;
  }

  // Identifiers in order; on failure the error message.
  std::string search(const TLString& text, const TLString& parameters = u"salt.maxTopK=9") {
    TLQuery query;
    query.setOriginalQuery(text);
    query.setSearchParams(TLParamsManager::paramsFromString(parameters));
    std::optional<TLError> error;
    std::string out;
    for (const auto& item : indexer->search(query, &error)) {
      out += platform::printable(item->identifier());
    }
    return error ? error->message : out;
  }

  // What the modification driver logged for this search, without the lines of others.
  std::vector<std::string> driverLines() const {
    const std::string prefix = "default TALIndexer: ";
    std::vector<std::string> lines;
    for (const std::string& line : log.lines()) {
      if (line.starts_with(prefix) && !line.starts_with(prefix + "Got ")) {
        lines.push_back(line.substr(prefix.size()));
      }
    }
    return lines;
  }

  testsupport::LogCapture log;
  testsupport::TemporaryDirectory directory;
  const std::string synonyms = directory / "synonyms.txt";
  std::shared_ptr<TALSqliteDocStore> store =
      std::make_shared<TALSqliteDocStore>(directory / "docstore/docstore.db");
  std::unique_ptr<TALIndexer> indexer;
};

const TLString kThreshold = u"queryModification.sufficentRetrievalThreshold=";
const TLString kSpellingOff = u"queryModification.enableSpellModification=NO";
const TLString kSynonymsOff = u"queryModification.enableSynonymModification=NO";
const TLString kStemsOff = u"queryModification.enableStemModification=NO";
using Lines = std::vector<std::string>;
const char* const kSpellingGoesOn =
    "Spelling correction finished without query modified. Continue with other query modification.";

}  // namespace

TEST_F(QueryModification, TriesSpellingThenSynonymsThenStemsUntilOneChangesSomething) {
  EXPECT_EQ(search(u"bill june"), "a");
  EXPECT_EQ(
      driverLines(),
      (Lines{"Query modification started for query with 3 terms", "Spelling correction started.",
             kSpellingGoesOn, "Synonyms modification started.",
             "Synonyms modification finished with query modified. Skipping all other query "
             "modification.",
             "Query modification finished. Results retrieved with modified query terms."}));
  log.clear();
  EXPECT_EQ(search(u"invoise june"), "a");
  EXPECT_EQ(
      driverLines(),
      (Lines{"Query modification started for query with 3 terms", "Spelling correction started.",
             "Spelling correction finished with query modified. Skipping all other query "
             "modification.",
             "Query modification finished. Results retrieved with modified query terms."}));
  log.clear();
  EXPECT_EQ(search(u"ordering june"), "b");
  EXPECT_EQ(
      driverLines(),
      (Lines{"Query modification started for query with 3 terms", "Spelling correction started.",
             kSpellingGoesOn, "Synonyms modification started.",
             "Synonyms modification finished without query modified. Continue with other "
             "query modification.",
             "Stem rewrite started.", "Stem rewrite finished with query modified.",
             "Query modification finished. Results retrieved with modified query terms."}));
  // The synonym wins, so the stem, which would find mail, is not tried.
  EXPECT_EQ(search(u"shipping "), "a");
  EXPECT_EQ(search(u"shipping ", kSynonymsOff), "b");
  EXPECT_EQ(search(u"shipping "), "a");
}

TEST_F(QueryModification, KeepsQueriesThatCannotBeModified) {
  EXPECT_EQ(search(u"zebra "), "");
  EXPECT_EQ(driverLines().back(),
            "Query modification didnt work out. Return original query results.");
  EXPECT_TRUE(log.has("default TALIndexer: Stem rewrite finished without query modified."));
  log.clear();
  EXPECT_EQ(search(u"bill ", kSpellingOff + u"," + kSynonymsOff + u"," + kStemsOff), "");
  EXPECT_EQ(driverLines(),
            (Lines{"Query modification started for query with 1 terms",
                   "Query modification didnt work out. Return original query results."}));
}

TEST_F(QueryModification, RunsUpToTheThresholdOfResults) {
  const struct {
    TLString text;
    TLString threshold;
    const char* found;
    bool runs;
  } cases[] = {
      {u"invoice ", u"0", "a", false}, {u"invoice ", u"1", "a", true},
      {u"june ", u"1", "ba", false},   {u"june ", u"-1", "ba", true},  // unsigned
      {u"bill", u"1", "c", true},
  };
  for (const auto& c : cases) {
    log.clear();
    EXPECT_EQ(search(c.text, kThreshold + c.threshold), c.found);
    EXPECT_EQ(log.contains("Query modification started"), c.runs) << platform::toUTF8(c.text);
  }
  // The second pass replaces the first one even if it finds less.
  EXPECT_EQ(search(u"billing", kThreshold + u"5"), "c");
  EXPECT_EQ(search(u"bill address june", kThreshold + u"5"), "");
  EXPECT_TRUE(TALIndexer::_notSufficientRetrieval({}, 0));
  EXPECT_FALSE(TALIndexer::_shouldRunQueryModification(6, 5));
}

TEST_F(QueryModification, AFailureOfTheSecondPassFailsTheSearch) {
  store->close();
  EXPECT_EQ(search(u"zebra "), "");
  const std::string failure = search(u"ordering ");
  EXPECT_TRUE(
      log.contains("error TALIndexer: Failed to search modified query in SALT due to error: "
                   "DocStore 1001: " +
                   failure));
  EXPECT_FALSE(log.contains("Query modification finished."));
}

TEST_F(QueryModification, HandlesManyAndUnusualWords) {
  TLString words;
  for (int i = 0; i < 1000; ++i) words += u"zebra" + platform::fromUTF8(std::to_string(i)) + u' ';
  EXPECT_EQ(search(words), "");
  EXPECT_EQ(search(u"\U0001F600\U0001F600\U0001F600 "),
            "Query processor failed to generate query terms");
  EXPECT_EQ(search(TLString(100000, u'x') + u" "), "");
}

TEST_F(QueryModification, WithoutASynonymFileThereAreNoSynonyms) {
  const std::string missing = directory / "none";
  TALIndexer other(directory / "other", "testing", nullptr, missing);
  EXPECT_TRUE(log.has("error TALIndexer: Failed to load synonym file: " + missing));
  EXPECT_TRUE(log.has("error TALSynonyms: Failed to load synonym file: " + missing));
  other.shutdown();
  // A reset does not read the synonyms again.
  log.clear();
  std::promise<void> done;
  indexer->resetWithCompletionHandler([&done](const auto&) { done.set_value(); });
  done.get_future().wait();
  EXPECT_FALSE(log.contains("TALSynonyms"));
}
