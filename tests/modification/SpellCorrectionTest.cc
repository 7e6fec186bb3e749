#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <map>
#include <sstream>

#include "docstore/TALSqliteDocStore.h"
#include "modification/TALSpellCorrection.h"
#include "modification/WeightedDistance.h"
#include "tests/modification/ModificationSupport.h"
#include "tests/salt/SaltSupport.h"

using saltsearch::Term;
using testing::ElementsAre;
using testsupport::word;

namespace {

constexpr uint16_t kZone = 13;

std::vector<std::string> tokens(const std::vector<TALCorrectionCandidate>& candidates) {
  std::vector<std::string> result;
  for (const auto& candidate : candidates) result.push_back(candidate._token);
  return result;
}

class SpellCorrectionTest : public testing::Test, protected testsupport::Corpus {
 protected:
  SpellCorrectionTest() : Corpus({}) {
    EXPECT_TRUE(store->openWithError(nullptr));
    vocab = std::make_shared<TALTopKVocab>(store, index.get());
    spelling = std::make_unique<TALSpellCorrection>(vocab);
  }

  // Searches, so that `found` is set, and corrects. Returns the first tokens of the terms, "-" if
  // nothing changed.
  std::string correct(std::vector<Term> terms) {
    std::vector<Term> corrected;
    score = spelling->correctSpelling(searched(std::move(terms)), corrected, *index);
    if (score <= 0) {
      EXPECT_EQ(score, -1);
      EXPECT_TRUE(corrected.empty());
      return "-";
    }
    return testsupport::tokensOf(corrected);
  }

  void add(uint32_t docID, const std::string& text, uint16_t zone = kZone) {
    ASSERT_TRUE(salttest::addZone(*index, docID, zone, text, salttest::wordOffsets(text)));
  }

  // Whether this message was logged at the default level.
  bool logs(const std::string& message) const {
    return log.has("default TALSpellCorrection: " + message);
  }

  const std::shared_ptr<TALSqliteDocStore> store =
      std::make_shared<TALSqliteDocStore>(directory / "docs.db");
  std::shared_ptr<TALTopKVocab> vocab;
  std::unique_ptr<TALSpellCorrection> spelling;
  float score = 0;
};

}  // namespace

TEST_F(SpellCorrectionTest, EditsComeInOrderOfPositionAndByLengthOfTheWord) {
  const struct {
    std::string word;
    size_t count;
    const char* some;  // candidates, each followed by its score, in order
    std::vector<std::string> none;
  } cases[] = {
      // No deletion, and a single pair to swap.
      {"ab",
       1 + 2 * 51 + 26,
       "ba 0.61 bb 0.73 zb 0.73 aab 0.55 zab 0.55 aa 0.81 az 0.81 aab 0.82 azb 0.82 aba 0.75 abz "
       "0.75",
       {"a", "b", "ab"}},
      {"abc",
       2 + 3 * 51 + 26,
       "bac 0.61 zabc 0.55 acb 0.62 azc 0.8 abz 0.81 abzc 0.82 abcz 0.75",
       {"ab", "ac", "bc"}},
      {"abcd",
       3 + 4 + 4 * 51 + 26,
       "bacd 0.61 bcd 0.6 acbd 0.7 acd 0.72 abdc 0.62 abc 0.79 abcdz 0.75",
       {"cd"}},
      {"aabb", 1 + 4 + 4 * 51 + 26, "abb 0.6 abab 0.7 aab 0.72", {}},
      // The budget of 1000 is exhausted at the nineteenth letter, after 18 * 53 candidates.
      {"abcdefghijklmnopqrst", 1000, "abcdefghijklmnopqrts 0.62", {"abcdefghijklmnopqrstz"}},
      {"abcdefghijklmnopqrstu", 1000, "abcdefghijklmnopqrtsu 0.7", {"abcdefghijklmnopqrsut"}},
  };
  for (const auto& c : cases) {
    const auto made = spelling->editOneCandidates(c.word);
    EXPECT_EQ(made.size(), c.count) << c.word;
    auto from = made.begin();
    std::istringstream some(c.some);
    for (auto [token, worth] = std::pair(std::string(), 0.0F); some >> token >> worth;) {
      while (from != made.end() && from->_token != token) ++from;
      ASSERT_NE(from, made.end()) << token;
      EXPECT_EQ(from->_scoreError, worth) << token;
      EXPECT_EQ(from->_scoreTopicality, 0);
    }
    for (const std::string& token : c.none) {
      EXPECT_THAT(tokens(made), testing::Not(testing::Contains(token)));
    }
  }
  EXPECT_TRUE(spelling->editOneCandidates("a").empty());
  EXPECT_TRUE(spelling->editOneCandidates("").empty());
  const TALSpellCorrection frugal(vocab, 5, 2);
  EXPECT_THAT(tokens(frugal.editOneCandidates("abcd")),
              ElementsAre("bacd", "bcd", "bbcd", "cbcd", "dbcd"));
}

TEST_F(SpellCorrectionTest, OnlyUnmatchedSingleWordsOfSomeLengthAreCorrected) {
  const auto refused = [](const std::function<void(Term&)>& change) {
    Term term = word("word ");
    change(term);
    return TALSpellCorrection::_doNotCorrect(term);
  };
  EXPECT_FALSE(refused([](Term&) {}));
  EXPECT_TRUE(refused([](Term& t) { t.isUnigram = false; }));
  EXPECT_TRUE(refused([](Term& t) { t.found = true; }));
  EXPECT_TRUE(refused([](Term& t) { t.tokens.clear(); }));
  EXPECT_TRUE(refused([](Term& t) { t.tokenScores.clear(); }));
  const std::map<size_t, bool> byLength{{0, true}, {1, true}, {2, false}, {21, false}, {22, true}};
  for (const auto& [length, expected] : byLength) {
    EXPECT_EQ(refused([size = length](Term& t) { t.tokens[0] = std::string(size, 'a'); }),
              expected);
  }
}

TEST_F(SpellCorrectionTest, FindsTheRightWordAfterEachKindOfMistake) {
  add(1, "quarterly invoice attached ");
  add(2, "lunch ");
  for (const char* typed : {"invoise ", "invoce ", "invvoice ", "invocie ", "nvoice ", "invoic "}) {
    EXPECT_EQ(correct({word("quarterly "), word(typed)}), "[quarterly ][invoice ]") << typed;
  }
  // A prefix is corrected to a prefix.
  EXPECT_EQ(correct({word("quarterly "), word("invxi")}), "[quarterly ][invoi]");
  EXPECT_TRUE(logs("No match token <\"in...\"<8 chars>> is considered for spelling correction."));
  EXPECT_TRUE(logs("Found 1 candidates in lexicon."));
  EXPECT_TRUE(logs(
      "Spelling returns best candidate with overall score: 1.610000, error score: 0.800000, text "
      "score: 0.810000. Term <\"in...\"<8 chars>> modified with candidate <\"in...\"<8 chars>>."));
}

TEST_F(SpellCorrectionTest, ChangesOneTokenAndItsScore) {
  add(1, "invoice ");
  std::vector<Term> terms{word("invoise ")};
  terms[0].tokens.push_back("other ");
  terms[0].tokenScores = {0.5, 0.25};
  std::vector<Term> corrected;
  EXPECT_FLOAT_EQ(spelling->correctSpelling(terms, corrected, *index), 0.8F + 0.9F);
  ASSERT_EQ(corrected.size(), 1U);
  EXPECT_THAT(corrected[0].tokens, ElementsAre("invoice ", "other "));
  EXPECT_THAT(corrected[0].tokenScores, ElementsAre(1.0, 0.25));
  EXPECT_EQ(corrected[0].zones, terms[0].zones);
  EXPECT_TRUE(corrected[0].isUnigram);
}

TEST_F(SpellCorrectionTest, CandidatesAreScoredByTheWholeQueryAndTheFirstWinsTies) {
  add(1, "cart red ");
  add(2, "cast blue ");
  add(3, "carp red ");
  EXPECT_EQ(correct({word("cazt "), word("blue ")}), "[cast ][blue ]");
  // Both replace the third letter.
  EXPECT_EQ(correct({word("caqt ")}), "[cart ]");
  // No document contains both a candidate and the other word.
  EXPECT_EQ(correct({word("cazt "), word("green ")}), "-");
  EXPECT_TRUE(logs("Skipping spelling correction as more than 1 term has no-matched document."));
  add(4, "green ");
  EXPECT_EQ(correct({word("cazt "), word("green ")}), "-");
  EXPECT_TRUE(logs("Best spelling candidate <\"ca...\"<5 chars>> has sub-zero textScore."));
  EXPECT_TRUE(logs("Spelling correction returns score -1."));
  EXPECT_EQ(correct({word("green ")}), "-");
  EXPECT_TRUE(logs("Skipping spelling correction as criteria not met."));
}

TEST_F(SpellCorrectionTest, CandidatesMustBeInTheTermsZonesAndWithinTheBudget) {
  add(1, "cart ", 99);
  EXPECT_EQ(correct({word("cazt ")}), "-");
  EXPECT_TRUE(logs("No candidates found in lexicon."));
  for (uint32_t docID = 2; docID < 8; ++docID) add(docID, "cast ", kZone - 1);
  add(9, "cast ");
  add(10, "cant ");
  add(11, "catt ");
  // Five suffixes in other zones come before the matching one.
  EXPECT_THAT(tokens(spelling->_getCandidates("cazt ", word("cazt "), *index)),
              ElementsAre("cant ", "catt "));
  const TALSpellCorrection frugal(vocab, 1000, 1);
  EXPECT_THAT(tokens(frugal._getCandidates("cazt ", word("cazt "), *index)), ElementsAre("cant "));
}

TEST_F(SpellCorrectionTest, UsesFrequentWordsWhereNoEditFits) {
  add(1, "international ");
  vocab->setVocab({"in ", "international ", "internationalisation", "internatioal", "intern "});
  EXPECT_EQ(correct({word("interantionel ")}), "[international ]");
  EXPECT_TRUE(
      logs("Spelling did not find any candidate from edit distance 1. Continue with topK method."));
  EXPECT_TRUE(logs("topKVocab has 5 entries."));
  // The form of the entry decides, not that of the typed word.
  const auto candidates = spelling->_getCandidatesFromTopKVocab("interantionel", true);
  ASSERT_THAT(tokens(candidates), ElementsAre("international ", "internatioal"));
  EXPECT_FLOAT_EQ(candidates[0]._scoreError, 1 - (cSwapMid + cSubMid) / 13);
  const TALSpellCorrection frugal(vocab, 1, 100);
  EXPECT_EQ(frugal._getCandidatesFromTopKVocab("interantionel", false).size(), 1U);

  vocab->setVocab({"na\xC3\xAFvet\xC3\xA9 "});
  add(2, "na\xC3\xAFvet\xC3\xA9 ");
  EXPECT_EQ(correct({word("na\xC3\xAFvetx\xC3\xA9 ")}), "[na\xC3\xAFvet\xC3\xA9 ]");
  EXPECT_TRUE(log.has("debug TALSpellCorrection: Token has unsupported char."));
  EXPECT_EQ(correct({word("\xF0\x9F\x98\x80\xF0\x9F\x98\x80 ")}), "-");
}

TEST_F(SpellCorrectionTest, HandlesAThousandWords) {
  add(1, "word ");
  std::vector<Term> terms(1000, word("word "));
  terms[500] = word("wrd ");
  for (Term& term : terms) term.zoneScores = {1, 1};
  EXPECT_NE(correct(terms), "-");
  terms[501] = word("wrd ");
  EXPECT_EQ(correct(terms), "-");
}
