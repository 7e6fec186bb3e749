#include <gtest/gtest.h>

#include <random>
#include <thread>

#include "salt/Alternatives.h"
#include "salt/IndexImpl.h"
#include "tests/salt/SaltSupport.h"
#include "tests/support/LogCapture.h"
#include "tests/support/Seed.h"
#include "tests/support/TemporaryDirectory.h"

using saltsearch::Term;

namespace {

std::string randomWord(std::mt19937& random, size_t longest) {
  std::string word;
  for (size_t n = 1 + random() % longest; n > 0; --n) word += static_cast<char>('a' + random() % 3);
  return word;
}

// Short words of few letters in some shards and the hot part, with deleted documents.
std::unique_ptr<salt::Index> randomIndex(const std::string& path, std::mt19937& random) {
  salt::Index::Options options;
  options.MaxPageSuffixes = 5;
  options.MaxShardSuffixes = 300;
  options.MaxHotSuffixes = 500;
  auto index = salttest::newIndex(path, options);
  for (uint32_t docID = 1; docID <= 300; ++docID) {
    std::string text;
    for (size_t n = 1 + random() % 6; n > 0; --n) text += randomWord(random, 6) + ' ';
    EXPECT_TRUE(salttest::addZone(*index, docID, static_cast<uint16_t>(1 + random() % 3), text,
                                  salttest::wordOffsets(text)));
    EXPECT_TRUE(docID % 7 != 0 || index->DeleteDoc(docID));
    if (docID == 100 || docID == 200) {
      index->Vacuum();
      index.reset();  // waits for the merge
      index = salttest::loadIndex(path);
    }
  }
  return index;
}

// A term like those of the query processor.
Term randomTerm(std::mt19937& random) {
  static constexpr std::pair<double, double> kWorths[] = {{5, 1}, {2, 0.8}, {1, 0}, {1, 0}, {0, 1}};
  Term term;
  const auto& [score, defaultScore] = kWorths[random() % 5];
  term.tokens = {randomWord(random, 3) + (random() % 2 ? " " : "")};
  if (random() % 4 == 0) term.tokens[0] += randomWord(random, 2);
  term.tokenScores = {score};
  term.defaultScore = defaultScore;
  for (uint16_t zone = 0; zone < 4; ++zone) {
    if (random() % 2 == 0) continue;
    term.zones.push_back(zone);
    term.zoneScores.push_back(static_cast<double>(random() % 10) / 10);
  }
  return term;
}

std::vector<std::string> randomTokens(std::mt19937& random) {
  std::vector<std::string> tokens;
  for (size_t n = random() % 30; n > 0; --n) {
    tokens.push_back(randomWord(random, 5) + (random() % 2 ? " " : ""));
  }
  return tokens;
}

void waitForBloomFilter(const salt::Index& index) {
  while (!dynamic_cast<const salt::index&>(index).starts().complete()) std::this_thread::yield();
}

class Alternatives : public testing::Test {
 protected:
  std::mt19937 random{testsupport::firstSeed()};
  const testsupport::TemporaryDirectory directory;
  const std::unique_ptr<salt::Index> index = randomIndex(directory / "i", random);
};

}  // namespace

TEST_F(Alternatives, ManyPrefixesFindTheSameAsEachAlone) {
  ASSERT_GT(index->GetMetrics().Shards, 1U);
  ASSERT_GT(index->GetMetrics().HotSuffixes, 0U);
  size_t found = 0;
  for (int round = 0; round < 200; ++round) {
    if (round == 100) {  // from now on the Bloom filter rejects most prefixes
      waitForBloomFilter(*index);
      EXPECT_TRUE(salttest::addZone(*index, 1000, 1, "cabbaca bbbbbb ", {0, 8}));
    }
    std::vector<std::string> prefixes = randomTokens(random);
    for (const char* prefix : {"ab", "ab", "cabbaca ", "bbbbb", "caaaaaaaaa"}) {
      prefixes.emplace_back(prefix);
    }
    if (round % 10 == 0) prefixes.push_back("");
    const size_t limit = 1 + random() % 6;
    const auto all = index->ScanPrefixes(prefixes, limit);
    ASSERT_EQ(all.size(), prefixes.size());
    for (size_t i = 0; i < prefixes.size(); ++i) {
      std::vector<std::string> first = salttest::scan(*index, prefixes[i]);
      first.resize(std::min(first.size(), limit));
      std::vector<std::string> probed;
      for (const auto& suffix : all[i]) probed.push_back(salttest::printed(suffix));
      ASSERT_EQ(probed, first) << prefixes[i];
      found += first.size();
    }
  }
  EXPECT_GT(found, 500U);
}

// The filter is built from a view and from what is added meanwhile; nothing may fall in between.
TEST(BloomFilter, HasWhatIsAddedWhileItIsBuilt) {
  constexpr uint32_t kDocs = 60;
  const testsupport::TemporaryDirectory directory;
  for (int round = 0; round < 20; ++round) {
    const auto index = salttest::newIndex(directory / std::to_string(round));
    std::vector<std::string> words;
    for (uint32_t docID = 1; docID <= kDocs; ++docID)
      words.push_back("word" + std::to_string(docID * 7919));
    std::atomic<uint32_t> added{0};
    std::thread adding([&] {
      for (uint32_t docID = 1; docID <= kDocs; ++docID) {
        EXPECT_TRUE(salttest::addZone(*index, docID, 1, words[docID - 1] + ' ', {0}));
        added = docID;
      }
    });
    while (added < kDocs / 3) std::this_thread::yield();
    (void)index->ScanPrefixes({"absent"}, 1);
    waitForBloomFilter(*index);
    adding.join();
    const auto found = index->ScanPrefixes(words, 10);
    for (size_t i = 0; i < words.size(); ++i) EXPECT_FALSE(found[i].empty()) << words[i];
  }
}

TEST_F(Alternatives, AnyDocumentAgreesWithSearch) {
  size_t yes = 0;
  for (int round = 0; round < 300; ++round) {
    Term term = randomTerm(random);
    if (round % 20 == 0) {
      term.tokens.push_back("b");
      term.tokenScores.push_back(1);
    }
    if (round % 30 == 1) term.zoneScores.push_back(1);
    const auto tokens = randomTokens(random);
    const size_t maxSuffixes = 1 + random() % 6;
    const auto any = saltsearch::AnyDocument(*index, term, tokens, maxSuffixes);
    ASSERT_EQ(any.size(), tokens.size());
    for (size_t i = 0; i < tokens.size(); ++i) {
      std::vector<Term> terms{term};
      terms[0].tokens[0] = tokens[i];
      ASSERT_EQ(any[i], !saltsearch::Search(*index, terms, {1, maxSuffixes, 0}).empty())
          << std::string(terms[0]);
      yes += any[i];
    }
  }
  EXPECT_GT(yes, 500U);
}

TEST_F(Alternatives, BestScoresEqualSearchToTheLastBit) {
  size_t scored = 0;
  for (int round = 0; round < 600; ++round) {
    std::vector<Term> terms(1 + random() % 5);
    for (Term& term : terms) term = randomTerm(random);
    const size_t position = random() % terms.size();
    terms[position].defaultScore = round % 20 == 0 ? 0.5 : 0;
    terms[position].tokenScores[0] = 0.25;
    if (round % 25 == 1) terms[random() % terms.size()].zones.push_back(2);
    if (round % 25 == 2) {
      terms[0].tokens.push_back("c");
      terms[0].tokenScores.push_back(0.5);
    }
    const double thresholds[] = {0.02, 0.02, 0, 0.3};
    const size_t limits[] = {1000000, 1000000, 3};
    const saltsearch::Options options{1, limits[random() % 3], thresholds[random() % 4]};
    const auto tokens = randomTokens(random);
    const auto best = saltsearch::BestScores(*index, terms, position, tokens, options);
    ASSERT_EQ(best.size(), tokens.size());
    for (size_t i = 0; i < tokens.size(); ++i) {
      std::vector<Term> changed = terms;
      changed[position].tokens[0] = tokens[i];
      changed[position].tokenScores[0] = 1;
      const auto results = saltsearch::Search(*index, changed, options);
      std::string query;
      for (const Term& term : changed) query += std::string(term);
      ASSERT_EQ(best[i], results.empty() ? std::nullopt : std::optional(results[0].score)) << query;
      scored += !results.empty();
    }
  }
  EXPECT_GT(scored, 500U);
}
