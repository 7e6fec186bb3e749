#include <gtest/gtest.h>

#include "modification/TALStemRewrite.h"
#include "tests/modification/ModificationSupport.h"

namespace {

using testsupport::Corpus;
using testsupport::word;
using Terms = std::vector<saltsearch::Term>;

// The rewritten tokens, or "no".
std::string rewrite(const Corpus& corpus, const Terms& terms) {
  TALStemRewrite rewriter;
  Terms out{word("left over")};
  return rewriter.stemRewrite(terms, out, *corpus.index) ? testsupport::tokensOf(out) : "no";
}

}  // namespace

TEST(StemRewrite, ReplacesEachWordByItsStemAsAPrefix) {
  const Corpus corpus({"we shipped the orders ", "shipping an order to a b "});
  saltsearch::Term phrase = word("shippings ordered ");
  phrase.isUnigram = false;
  saltsearch::Term empty = word("");
  saltsearch::Term scoreless = word("shippings ");
  scoreless.tokenScores.clear();
  saltsearch::Term weak = word("ordering");
  weak.tokenScores = {0.1};
  // Words are stemmed whether they were found or not; those of less than 3 bytes are unchanged.
  EXPECT_EQ(rewrite(corpus, corpus.searched({phrase, empty, scoreless, word("shippings "), weak,
                                             word("order "), word("a "), word("b"), word("to ")})),
            "[shippings ordered ][][shippings ][ship][order][order][a ][b][to]");
  EXPECT_TRUE(corpus.log.has("default TALStemRewrite: Token <shippings > is stemmed to <ship>."));
  EXPECT_TRUE(corpus.log.has(
      "default TALStemRewrite: Stem rewrite returns with 4 query term(s) modified."));
  Terms out;
  ASSERT_TRUE(TALStemRewrite().stemRewrite({weak}, out, *corpus.index));
  EXPECT_EQ(out[0].tokenScores, (std::vector<double>{1.0}));
  EXPECT_EQ(out[0].zoneScores, weak.zoneScores);
  EXPECT_EQ(weak.tokens[0], "ordering");
}

TEST(StemRewrite, GivesUpWithoutAWordOrAtAStemThatIsNotInTheIndex) {
  const Corpus corpus({"ship order "});
  for (const Terms& terms : {Terms{}, Terms{word("a "), word("b")}}) {
    EXPECT_EQ(rewrite(corpus, terms), "no");
  }
  EXPECT_EQ(corpus.log.count("Stem rewrite returns with NO query term modified."), 2u);
  EXPECT_EQ(rewrite(corpus, {word("ships "), word("walking "), word("orders ")}), "no");
  EXPECT_TRUE(corpus.log.has(
      "default TALStemRewrite: Skipping stem rewrite as stemToken has no match in the lexicon"));
  EXPECT_FALSE(corpus.log.contains("orders"));
  // A zone that is not searched does not count.
  saltsearch::Term elsewhere = word("ships ");
  elsewhere.zones = {107};
  elsewhere.zoneScores = {1};
  EXPECT_EQ(rewrite(corpus, {elsewhere}), "no");
}

TEST(StemRewrite, ChangesTenWordsAtMost) {
  const Corpus corpus({"ship "});
  Terms terms(10, word("ships "));
  std::string ten;
  for (int i = 0; i < 10; ++i) ten += "[ship]";
  EXPECT_EQ(rewrite(corpus, terms), ten);
  EXPECT_TRUE(corpus.log.contains("with 10 query term(s) modified."));
  terms.insert(terms.end(), {word("a "), word("ships "), word("nowhere ")});
  EXPECT_EQ(rewrite(corpus, terms), ten + "[a ][ships ][nowhere ]");
  EXPECT_TRUE(
      corpus.log.has("default TALStemRewrite: Stem rewrite returns with 10 query terms modified. "
                     "MAX_TOKENS_TO_STEM exceeded."));
}
