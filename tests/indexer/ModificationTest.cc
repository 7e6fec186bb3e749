#include "parameters/TLParamsManager.h"
#include "platform/Files.h"
#include "tests/indexer/IndexerSupport.h"

namespace {

using testsupport::mail;

// An indexer with three mails and its own synonyms.
class QueryModification : public testsupport::IndexerTest {
 protected:
  QueryModification() {
    EXPECT_TRUE(platform::writeFileAtomically(directory / "synonyms.txt",
                                              "bill,invoice\nshipping,invoice\n", nullptr));
    reopen();
    EXPECT_EQ(add({mail("a", "your invoice of june"), mail("b", "orders shipped in june"),
                   mail("c", "the billing address")}),
              std::nullopt);
    log.clear();
  }

  std::string search(const std::string& text, TLStringView parameters = u"salt.maxTopK=9") {
    return IndexerTest::search(text, TLParamsManager::paramsFromString(parameters));
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
};

const TLString kThreshold = u"queryModification.sufficentRetrievalThreshold=";
const TLString kSynonymsOff = u"queryModification.enableSynonymModification=NO";
using Lines = std::vector<std::string>;

}  // namespace

TEST_F(QueryModification, TriesSpellingThenSynonymsThenStemsUntilOneChangesSomething) {
  const std::string skips = " finished with query modified. Skipping all other query modification.";
  const std::string goesOn =
      " finished without query modified. Continue with other query modification.";
  const struct {
    const char* text;
    const char* found;
    Lines lines;
  } cases[] = {
      {"bill june",
       "a",
       {"Spelling correction" + goesOn, "Synonyms modification started.",
        "Synonyms modification" + skips}},
      {"invoise june", "a", {"Spelling correction" + skips}},
      {"ordering june",
       "b",
       {"Spelling correction" + goesOn, "Synonyms modification started.",
        "Synonyms modification" + goesOn, "Stem rewrite started.",
        "Stem rewrite finished with query modified."}},
  };
  for (const auto& c : cases) {
    log.clear();
    EXPECT_EQ(search(c.text), c.found);
    Lines lines{"Query modification started for query with 3 terms",
                "Spelling correction started."};
    lines.insert(lines.end(), c.lines.begin(), c.lines.end());
    lines.push_back("Query modification finished. Results retrieved with modified query terms.");
    EXPECT_EQ(driverLines(), lines);
  }
  // The synonym wins, so the stem, which would find mail, is not tried.
  EXPECT_EQ(search("shipping "), "a");
  EXPECT_EQ(search("shipping ", kSynonymsOff), "b");
  EXPECT_EQ(search("shipping "), "a");
}

TEST_F(QueryModification, KeepsQueriesThatCannotBeModified) {
  EXPECT_EQ(search("zebra "), "");
  EXPECT_EQ(driverLines().back(),
            "Query modification didnt work out. Return original query results.");
  EXPECT_TRUE(log.has("default TALIndexer: Stem rewrite finished without query modified."));
  log.clear();
  EXPECT_EQ(search("bill ", kSynonymsOff + u",queryModification.enableSpellModification=NO,"
                                           u"queryModification.enableStemModification=NO"),
            "");
  EXPECT_EQ(driverLines(),
            (Lines{"Query modification started for query with 1 terms",
                   "Query modification didnt work out. Return original query results."}));
}

TEST_F(QueryModification, RunsUpToTheThresholdOfResults) {
  const struct {
    std::string text;
    TLString threshold;
    const char* found;
    bool runs;
  } cases[] = {
      {"invoice ", u"0", "a", false}, {"invoice ", u"1", "a", true},
      {"june ", u"1", "b a", false},  {"june ", u"-1", "b a", true},  // unsigned
      {"bill", u"1", "c", true},
  };
  for (const auto& c : cases) {
    log.clear();
    EXPECT_EQ(search(c.text, kThreshold + c.threshold), c.found);
    EXPECT_EQ(log.contains("Query modification started"), c.runs) << c.text;
  }
  // The second pass replaces the first one even if it finds less.
  EXPECT_EQ(search("billing", kThreshold + u"5"), "c");
  EXPECT_EQ(search("bill address june", kThreshold + u"5"), "");
  EXPECT_TRUE(TALIndexer::_notSufficientRetrieval({}, 0));
  EXPECT_FALSE(TALIndexer::_shouldRunQueryModification(6, 5));
}

TEST_F(QueryModification, AFailureOfTheSecondPassFailsTheSearch) {
  store->close();
  EXPECT_EQ(search("zebra "), "");
  const std::string failure = search("ordering ");
  EXPECT_TRUE(
      log.contains("error TALIndexer: Failed to search modified query in SALT due to error: "
                   "DocStore 1001: " +
                   failure));
  EXPECT_FALSE(log.contains("Query modification finished."));
}

TEST_F(QueryModification, HandlesManyAndUnusualWords) {
  std::string words;
  for (int i = 0; i < 1000; ++i) words += "zebra" + std::to_string(i) + ' ';
  EXPECT_EQ(search(words), "");
  EXPECT_EQ(search("\U0001F600\U0001F600\U0001F600 "),
            "Query processor failed to generate query terms");
  EXPECT_EQ(search(std::string(100000, 'x') + ' '), "");
}

TEST_F(QueryModification, WithoutASynonymFileThereAreNoSynonyms) {
  const std::string missing = directory / "none";
  TALIndexer other(directory / "other", "testing", nullptr, missing);
  EXPECT_TRUE(log.has("error TALIndexer: Failed to load synonym file: " + missing));
  EXPECT_TRUE(log.has("error TALSynonyms: Failed to load synonym file: " + missing));
  other.shutdown();
  // A reset does not read the synonyms again.
  log.clear();
  EXPECT_EQ(reset(), std::nullopt);
  EXPECT_FALSE(log.contains("TALSynonyms"));
}
