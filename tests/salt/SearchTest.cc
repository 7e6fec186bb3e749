#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <map>
#include <random>
#include <set>

#include "salt/Search.h"
#include "tests/salt/SaltSupport.h"
#include "tests/support/LogCapture.h"
#include "tests/support/Seed.h"
#include "tests/support/TemporaryDirectory.h"

using saltsearch::DocResult;
using saltsearch::Options;
using saltsearch::Term;
using salttest::addZone;
using salttest::newIndex;
using testing::ElementsAre;
using testsupport::TemporaryDirectory;

namespace {

constexpr Options kAll{1000, 1000000, 0};

Term term(std::vector<std::string> tokens, std::vector<double> scores, double defaultScore = 0) {
  Term made;
  made.tokens = std::move(tokens);
  made.tokenScores = std::move(scores);
  made.defaultScore = defaultScore;
  return made;
}

Term inZones(Term made, std::vector<uint16_t> zones, std::vector<double> scores) {
  made.zones = std::move(zones);
  made.zoneScores = std::move(scores);
  return made;
}

std::vector<std::string> printed(const std::vector<DocResult>& results) {
  std::vector<std::string> lines;
  for (const DocResult& result : results) lines.emplace_back(result);
  return lines;
}

std::vector<std::string> search(const salt::Index& index, std::vector<Term> terms,
                                const Options& options = kAll) {
  return printed(saltsearch::Search(index, terms, options));
}

using Texts = std::map<std::pair<uint32_t, uint16_t>, std::string>;

// Evaluates every document against every term, using only the texts.
class Oracle {
 public:
  explicit Oracle(const Texts& texts) : _texts(texts) {}

  [[nodiscard]] std::vector<DocResult> search(const std::vector<Term>& terms,
                                              const Options& options) const {
    std::map<uint32_t, DocResult> results;
    for (const auto& [place, text] : _texts) {
      DocResult result;
      result.docID = place.first;
      result.score = 1;
      bool matched = false;
      for (const Term& t : terms) result.score *= factor(t, place.first, &matched);
      if (matched && result.score >= options.threshold) results[place.first] = result;
    }
    std::vector<DocResult> sorted;
    for (const auto& [docID, result] : results) sorted.push_back(result);
    std::sort(sorted.begin(), sorted.end(), [](const DocResult& a, const DocResult& b) {
      return std::pair(a.score, a.docID) > std::pair(b.score, b.docID);
    });
    sorted.resize(std::min(sorted.size(), options.maxResults));
    return sorted;
  }

 private:
  static constexpr uint16_t kAny[] = {0};  // the last entry of this zone counts

  double factor(const Term& t, uint32_t docID, bool* matched) const {
    std::vector<double> scores;
    std::vector<bool> zoneHit(t.zones.size());
    for (const auto& [place, text] : _texts) {
      if (place.first != docID) continue;
      auto zone = std::find(t.zones.begin(), t.zones.end(), place.second);
      if (zone == t.zones.end())
        zone = std::find_end(t.zones.begin(), t.zones.end(), kAny, kAny + 1);
      if (zone == t.zones.end() && !t.zones.empty()) continue;
      for (size_t i = 0; i < t.tokens.size(); ++i) {
        for (const uint32_t offset : salttest::wordOffsets(text)) {
          if (text.compare(offset, t.tokens[i].size(), t.tokens[i]) != 0) continue;
          scores.push_back(t.tokenScores[i]);
          if (!t.zones.empty()) zoneHit[static_cast<size_t>(zone - t.zones.begin())] = true;
        }
      }
    }
    if (scores.empty()) return t.defaultScore;
    *matched = true;
    const auto [low, high] = std::minmax_element(scores.begin(), scores.end());
    double weight = 0;
    for (size_t i = 0; i < zoneHit.size(); ++i) weight += zoneHit[i] ? t.zoneScores[i] : 0;
    return (t.isMin ? *low : *high) * (t.zones.empty() ? 1.0 : std::min(weight, 1.0));
  }

  const Texts& _texts;
};

// Scores are powers of two, so products are exact, and no match scores below the default, so a
// document dropped early cannot become better later.
Term randomTerm(std::mt19937& random) {
  Term made;
  for (size_t i = random() % 4; i > 0; --i) {
    made.tokens.push_back(std::string(1 + random() % 2, static_cast<char>('a' + random() % 4)));
    if (random() % 3 == 0) made.tokens.back() += ' ';
    made.tokenScores.push_back(random() % 2 ? 1 : 0.5);
  }
  std::vector<uint16_t> zones{0, 1, 2, 3, 4};
  std::shuffle(zones.begin(), zones.end(), random);
  zones.resize(random() % 4);
  if (!zones.empty() && random() % 4 == 0) zones.push_back(zones[0]);
  for (const uint16_t zone : zones) {
    made.zones.push_back(zone);
    made.zoneScores.push_back(1.0 / static_cast<double>(1 << random() % 3));
  }
  made.defaultScore = random() % 2 ? 0 : 0.125;
  made.isMin = random() % 3 == 0;
  return made;
}

}  // namespace

TEST(Search, AgreesWithAnExhaustiveEvaluation) {
  std::mt19937 random(16 + testsupport::firstSeed());
  const TemporaryDirectory directory;
  salt::Index::Options small;
  small.MaxHotSuffixes = 200;
  small.MaxShardSuffixes = 500;
  auto index = newIndex(directory / "i", small);
  Texts texts;
  for (int zone = 0; zone < 400; ++zone) {
    if (zone % 150 == 100) {  // what comes before is in pages, with posting lists, and the rest hot
      index->Vacuum();
      index.reset();  // ends the merge
      index = salttest::loadIndex(directory / "i");
    }
    std::string text;
    for (size_t words = 1 + random() % 4; words > 0; --words) {
      for (size_t n = 1 + random() % 3; n > 0; --n) text += static_cast<char>('a' + random() % 4);
      text += ' ';
    }
    const std::pair<uint32_t, uint16_t> place(1 + random() % 150 * 11, 1 + random() % 5);
    if (!texts.emplace(place, text).second) continue;
    ASSERT_TRUE(addZone(*index, place.first, place.second, text, salttest::wordOffsets(text)));
  }
  for (uint32_t docID = 1; docID < 1650; docID += 7 * 11) {
    ASSERT_TRUE(index->DeleteDoc(docID));
    std::erase_if(texts, [docID](const auto& entry) { return entry.first.first == docID; });
  }
  const Oracle oracle(texts);
  size_t nonEmpty = 0;
  for (int round = 0; round < 1000; ++round) {
    std::vector<Term> terms(random() % 5);
    for (Term& t : terms) t = randomTerm(random);
    // More tokens than are looked for together.
    if (!terms.empty() && random() % 8 == 0) terms.resize(40, Term(terms.back()));
    const double thresholds[] = {0, 0.001, 0.0625, 0.25, 0.3, 1};
    const size_t limits[] = {0, 1, 5, 1000, 1000, 1000};
    const Options options{limits[random() % 6], 1000000, thresholds[random() % 6]};
    const auto expected = printed(oracle.search(terms, options));
    nonEmpty += !expected.empty();
    std::string query;
    for (const Term& t : terms) query += std::string(t);
    ASSERT_EQ(printed(saltsearch::Search(*index, terms, options)), expected)
        << query << " threshold " << options.threshold;
  }
  EXPECT_GT(nonEmpty, 250u);
}

class SearchSmall : public testing::Test {
 protected:
  void SetUp() override {
    ASSERT_TRUE(addZone(*index, 1, 1, "apple pear ", {0, 6}));
    ASSERT_TRUE(addZone(*index, 2, 1, "apple ", {0}));
    ASSERT_TRUE(addZone(*index, 2, 2, "pear ", {0}));
    ASSERT_TRUE(addZone(*index, 3, 3, "apple ", {0}));
    ASSERT_TRUE(addZone(*index, 4, 1, "plum ", {0}));
  }

  const TemporaryDirectory directory;
  const std::unique_ptr<salt::Index> index = newIndex(directory / "i");
};

// More than are scanned before the others.
TEST_F(SearchSmall, EachOfManyRequiredTermsIsRequired) {
  std::vector<Term> terms(20, term({"apple"}, {1}));
  terms.insert(terms.begin(), term({"pear"}, {2}, 0.5));
  EXPECT_THAT(search(*index, terms, {10, 100, 0.1}), ElementsAre("2:2", "1:2", "3:0.5"));
  terms.back() = term({"pear"}, {1});
  EXPECT_THAT(search(*index, terms, {10, 100, 0.1}), ElementsAre("2:2", "1:2"));
  terms.back() = term({"plum"}, {1});
  EXPECT_THAT(search(*index, terms, {10, 100, 0.1}), ElementsAre());
}

TEST_F(SearchSmall, MalformedTermsAreSkippedWithALogLine) {
  const Term apple = term({"apple"}, {1});
  const auto zones = [&apple](uint16_t count) {
    std::vector<uint16_t> numbers;
    for (uint16_t zone = 1; zone <= count; ++zone) numbers.push_back(zone);
    return inZones(apple, numbers, std::vector<double>(count, 1));
  };
  const struct {
    Term bad;
    std::string line;
  } cases[] = {
      {term({"pear", "plum"}, {1}), "error SALT: Mismatched tokens in query."},
      {inZones(term({"pear"}, {1}), {1}, {}), "error SALT: Mismatched zones in query."},
      {zones(32), "error SALT: Too many zones in query: 32."},
  };
  for (const auto& c : cases) {
    const testsupport::LogCapture log;
    std::vector<Term> terms{c.bad, apple};
    EXPECT_THAT(printed(saltsearch::Search(*index, terms, kAll)), ElementsAre("3:1", "2:1", "1:1"));
    EXPECT_TRUE(log.has(c.line)) << c.line;
    EXPECT_FALSE(terms[0].found);
  }
  EXPECT_THAT(search(*index, {zones(31)}), ElementsAre("3:1", "2:1", "1:1"));
}

TEST_F(SearchSmall, SuffixesAreLimitedPerTermAndFoundIsSet) {
  std::vector<Term> terms{term({"apple", "pear", "none"}, {1, 1, 1}), term({"none"}, {1}, 1)};
  const auto results = saltsearch::Search(*index, terms, {10, 2, 0});
  EXPECT_THAT(printed(results), ElementsAre("3:1", "2:1"));  // "apple " before "apple pear "
  EXPECT_EQ(index->GetMetrics().ScanResults, 4u);  // two taken, and one rejected per token
  EXPECT_TRUE(terms[0].found);
  EXPECT_FALSE(terms[1].found);
  EXPECT_EQ(results[0].tokenScore, -1.0);
  EXPECT_EQ(results[0].zoneMask, 0u);
}

// Where not all suffixes are taken, a scan reads them one by one.
TEST(SearchLimit, IsExactAndCounted) {
  const TemporaryDirectory directory;
  const auto index = salttest::newIndex(directory / "index");
  for (uint32_t docID = 1; docID <= 700; ++docID) {
    ASSERT_TRUE(salttest::addZone(*index, docID, 1, "apple"));
  }
  for (const size_t limit : {1, 255, 256, 257, 300, 600, 699, 700, 701}) {
    index->ResetScanMetrics();
    std::vector<Term> terms{term({"apple"}, {1})};
    EXPECT_EQ(saltsearch::Search(*index, terms, {1000, limit, 0}).size(),
              std::min<size_t>(limit, 700));
    EXPECT_EQ(index->GetMetrics().ScanResults, std::min<size_t>(limit + 1, 700));
  }
}

// Suffixes of deleted documents are in posting lists and what is cached of them, but do not count.
TEST(SearchLimit, IsExactOverTokensWithPostingListsAndDeletedDocuments) {
  const TemporaryDirectory directory;
  salt::Index::Options small;
  small.MaxHotSuffixes = 200;
  const auto index = salttest::newIndex(directory / "index", small);
  for (uint32_t docID = 1; docID <= 700; ++docID) {
    ASSERT_TRUE(salttest::addZone(*index, docID, 1, "apple "));
    ASSERT_TRUE(salttest::addZone(*index, 1000 + docID, 1, "pear "));
  }
  ASSERT_TRUE(index->Compact());  // after the merge that runs
  index->Vacuum();
  ASSERT_TRUE(index->Compact());
  for (uint32_t docID = 1; docID <= 1700; docID += 5) ASSERT_TRUE(index->DeleteDoc(docID));
  std::vector<std::string> inOrder = salttest::scan(*index, "apple");
  for (const std::string& suffix : salttest::scan(*index, "pear")) inOrder.push_back(suffix);
  const auto expectExact = [&](size_t limit) {
    const auto taken = inOrder.begin() + static_cast<ptrdiff_t>(std::min(limit, inOrder.size()));
    std::set<std::string> docs;
    for (auto at = inOrder.begin(); at != taken; ++at) docs.insert(at->substr(0, at->find(',')));
    std::set<std::string> found;
    for (const std::string& doc :
         search(*index, {term({"apple", "pear"}, {1, 1})}, {2000, limit, 0})) {
      found.insert(doc.substr(0, doc.find(':')));
    }
    EXPECT_EQ(found, docs) << limit;
  };
  for (int time = 0; time < 2; ++time) {  // the second time the sets are cached
    for (const size_t limit : {0, 1, 300, 559, 560, 561, 700, 950, 1100, 1119, 1120, 1121, 2000}) {
      expectExact(limit);
    }
  }
}

TEST(SearchText, TermsAndResultsPrint) {
  Term t = term({"a b", "c"}, {0.5, 1}, 0.25);
  EXPECT_EQ(std::string(t), "{\"a b\":0.5 | \"c\":1 default:0.25}");
  t = inZones(term({"x"}, {1}), {3, 0}, {0.5, 2});
  t.isMin = true;
  EXPECT_EQ(std::string(t), "{MIN \"x\":1 zones:{3:0.5,0:2}}");
  EXPECT_EQ(std::string(Term()), "{}");
  EXPECT_EQ(std::string(DocResult{7, 0, 0.125, -1}), "7:0.125");
  EXPECT_EQ(saltsearch::ZoneScoreDefault(1, 2), 1.0);
}
