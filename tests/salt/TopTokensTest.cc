#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <malloc.h>

#include <algorithm>
#include <cmath>
#include <map>
#include <random>

#include "salt/Search.h"
#include "salt/TopTokens.h"
#include "tests/salt/SaltSupport.h"
#include "tests/support/Seed.h"
#include "tests/support/TemporaryDirectory.h"

using saltsearch::TokenizeSpace;
using saltsearch::TopKTokens;
using saltsearch::ZoneScoreDefault;
using salttest::addZone;
using testing::ElementsAre;
using testing::Pair;

namespace {

using Counts = std::map<std::string, double>;

// Adds zones of random words, and returns the weight of each word, counted separately.
Counts fill(salt::Index& index, std::mt19937& random, bool skewed) {
  Counts counts;
  std::uniform_real_distribution<double> exponent(0, std::log(5000));
  for (uint32_t docID = 1; docID <= 400; ++docID) {
    const auto zone = static_cast<uint16_t>(1 + random() % 3);
    std::string text;
    for (size_t n = 1 + random() % 60; n > 0; --n) {
      const auto rank = skewed ? static_cast<size_t>(std::exp(exponent(random))) : random() % 5000;
      const std::string token = "w" + std::to_string(rank) + ' ';
      text += token;
      counts[token] += zone;
    }
    addZone(index, docID, zone, text);
  }
  return counts;
}

}  // namespace

TEST(TopTokens, CountsExactlyWhatTheSummaryGuarantees) {
  size_t certain = 0;
  for (const bool skewed : {false, true}) {
    for (const size_t k : {size_t{1}, size_t{30}, size_t{100}, size_t{1000}, size_t{10000}}) {
      std::mt19937 random(testsupport::firstSeed() + static_cast<uint32_t>(k));
      const testsupport::TemporaryDirectory directory;
      const auto index = salttest::newIndex(directory / "i");
      const Counts counts = fill(*index, random, skewed);
      const auto top = TopKTokens(
          *index, k, [](uint32_t, uint16_t zone) { return zone; }, TokenizeSpace);
      ASSERT_LE(top.size(), k);
      EXPECT_TRUE(std::is_sorted(top.begin(), top.end(), [](const auto& a, const auto& b) {
        return a.second > b.second || (a.second == b.second && a.first < b.first);
      }));
      for (const auto& [token, weight] : top) ASSERT_EQ(weight, counts.at(token)) << token;

      double total = 0;
      for (const auto& [token, weight] : counts) total += weight;
      const size_t kept = std::max<size_t>(k, 100);
      const double guaranteed = counts.size() <= kept ? 0 : total / static_cast<double>(kept);
      const double last = top.size() == k ? top.back().second : 0;
      for (const auto& [token, weight] : counts) {
        if (weight <= guaranteed || weight <= last) continue;
        ++certain;
        EXPECT_TRUE(std::any_of(top.begin(), top.end(), [&name = token](const auto& t) {
          return t.first == name;
        })) << token;
      }
    }
  }
  EXPECT_GT(certain, 4000U);
}

TEST(TopTokens, SkipsDeletedDocumentsAndVeryLongTokens) {
  const testsupport::TemporaryDirectory directory;
  const auto index = salttest::newIndex(directory / "i");
  addZone(*index, 1, 1, "b a  b a");
  addZone(*index, 2, 1, " a " + std::string(saltsearch::kMaxTokenBytes + 1, 'x'));
  addZone(*index, 3, 1, "gone gone");
  addZone(*index, 4, 1, " ");
  ASSERT_TRUE(index->DeleteDoc(3));
  const auto top = [&](size_t k) { return TopKTokens(*index, k, ZoneScoreDefault, TokenizeSpace); };
  EXPECT_THAT(top(10), ElementsAre(Pair("b ", 2), Pair("a", 1), Pair("a ", 1), Pair("a  ", 1)));
  EXPECT_THAT(top(1), ElementsAre(Pair("b ", 2)));
  EXPECT_THAT(top(0), ElementsAre());
}

TEST(TopTokens, TakesNoMoreMemoryForMoreTokens) {
  const testsupport::TemporaryDirectory directory;
  const auto index = salttest::newIndex(directory / "i");
  for (uint32_t docID = 1; docID <= 300; ++docID) {
    std::string text;
    for (int i = 0; i < 1000; ++i) {
      text += "token-of-more-than-fifteen-bytes-" + std::to_string(docID * 1000 + i) + ' ';
    }
    ASSERT_TRUE(addZone(*index, docID, 1, text));
  }
  const size_t before = mallinfo2().uordblks;
  size_t most = 0;
  const auto watch = [&] {
    most = std::max(most, mallinfo2().uordblks);
    return true;
  };
  ASSERT_EQ(TopKTokens(*index, 100, ZoneScoreDefault, TokenizeSpace, watch).size(), 100U);
  if (before == 0) GTEST_SKIP() << "this allocator does not count";
  EXPECT_LT(most, before + 2'000'000);  // all tokens would take 30 million
}

TEST(TopTokens, SplittersFindTheStartsOfWords) {
  const struct {
    const char* text;
    std::vector<uint32_t> space;
    std::vector<uint32_t> letters;
  } cases[] = {
      {"", {}, {}},
      {"   ", {}, {}},
      {" a", {1}, {1}},
      {"ab  cd ", {0, 4}, {0, 4}},
      {"ab12cd", {0}, {0, 4}},
      {"1a", {0}, {1}},
      {"\xC3\xA4z\tB", {0}, {2, 4}},
      {"a-b", {0}, {0, 2}},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(TokenizeSpace(c.text), c.space) << c.text;
    EXPECT_EQ(saltsearch::TokenizeAlphanum(c.text), c.letters) << c.text;
  }
}
