#include <gtest/gtest.h>

#include "parameters/TLParamsManager.h"
#include "query/TALQueryProcessor.h"
#include "tests/support/LogCapture.h"

namespace {

using enum TLAttributeKey;
using Op = TLQueryNodeOp;
using Merge = TLQueryNodeMergeOp;

std::shared_ptr<TLQueryNode> leaf(TLAttributeKey key, TLString value, Op op = Op::STRING_EQUAL) {
  auto node = std::make_shared<TLQueryNode>();
  node->addKey(key);
  node->setStringValue(std::move(value));
  node->setOp(op);
  return node;
}

std::shared_ptr<TLQueryNode> inner(Merge mergeOp,
                                   std::vector<std::shared_ptr<TLQueryNode>> childs) {
  auto node = std::make_shared<TLQueryNode>();
  node->setMergeOp(mergeOp);
  node->setChilds(std::move(childs));
  return node;
}

std::shared_ptr<TLParameters> parameters(TLStringView overrides) {
  return TLParamsManager::resolveOverrides(*TLParamsManager::paramsFromString(overrides), true);
}

class QueryProcessorTest : public testing::Test {
 protected:
  QueryProcessorTest() : processor(TALQueryProcessor::initWithZoneManager(zoneManager, nullptr)) {}

  std::vector<TALTerm> termsOfText(const TLString& text) const {
    TLQuery query;
    query.setOriginalQuery(text);
    return processor->termsFromQuery(query);
  }
  std::vector<TALTerm> termsOfTree(std::shared_ptr<TLQueryNode> root) const {
    TLQuery query;
    query.setRoot(std::move(root));
    return processor->termsFromQuery(query);
  }

  // One line per term: tokens with scores, score without a match, whether it is a single word.
  static std::string print(const std::vector<TALTerm>& terms) {
    std::string out;
    for (const TALTerm& term : terms) {
      const std::string text = term.description();
      const size_t zones = text.find(" zones:");
      out += text.substr(0, zones) + (term.isUnigram() ? " word\n" : "\n");
    }
    return out;
  }
  static std::string zonesOf(const TALTerm& term) {
    const std::string text = term.description();
    const size_t from = text.find("zones:");
    return text.substr(from, text.find('}') + 1 - from);
  }

  testsupport::LogCapture log;
  TALZoneManager zoneManager;
  std::unique_ptr<TALQueryProcessor> processor;
};

}  // namespace

TEST_F(QueryProcessorTest, FreeTextBecomesPhrasePairsAndWords) {
  const std::vector<std::pair<TLString, std::string>> cases{
      {u"", ""},
      {u"?! -", ""},
      {u"Inv", "[\"inv\" 1] nomatch:0 word\n"},
      {u"inv ", "[\"inv \" 1] nomatch:0 word\n"},
      {u"caf\u00e9?", "[\"cafe \" 1] nomatch:0 word\n"},
      {u"a b", "[\"a b\" 2] nomatch:0.8\n[\"a \" 1] nomatch:0 word\n[\"b\" 1] nomatch:0 word\n"},
      {u"a a", "[\"a a\" 2] nomatch:0.8\n[\"a \" 1] nomatch:0 word\n[\"a\" 1] nomatch:0 word\n"},
      {u"a b c",
       "[\"a b c\" 5] nomatch:1\n[\"a b \" 2] nomatch:0.8\n[\"b c\" 2] nomatch:0.8\n"
       "[\"a \" 1] nomatch:0 word\n[\"b \" 1] nomatch:0 word\n[\"c\" 1] nomatch:0 word\n"},
      {u"a b c.",
       "[\"a b c \" 5] nomatch:1\n[\"a b \" 2] nomatch:0.8\n[\"b c \" 2] nomatch:0.8\n"
       "[\"a \" 1] nomatch:0 word\n[\"b \" 1] nomatch:0 word\n[\"c \" 1] nomatch:0 word\n"},
  };
  for (const auto& [text, expected] : cases) {
    EXPECT_EQ(print(termsOfText(text)), expected) << platform::toUTF8(text);
  }
  EXPECT_TRUE(log.has("default TALQueryProcessor: Query tree node is empty."));
}

TEST_F(QueryProcessorTest, TheFirstPassUsesSynonymsAndStemsIfTheParametersSaySo) {
  TALSynonyms synonyms;
  synonyms.setSynonymVocab({{"invoices", {"bills", "money owed"}}, {"ships", {"ship"}}});
  processor = TALQueryProcessor::initWithZoneManager(zoneManager, &synonyms);
  const TLString bySynonyms = u"queryModification.enableSynonymModificationFirstPass=YES";
  const TLString byStems = u"queryModification.enableStemModificationFirstPass=YES";
  // The score of a synonym is a float, that of a stem a double.
  const struct {
    TLString text;
    TLString parameters;
    std::string terms;
  } cases[] = {
      {u"invoices ", u"salt.maxTopK=1", "[\"invoices \" 1] nomatch:0 word\n"},
      {u"invoices ", bySynonyms,
       "[\"invoices \" 1 | \"bills \" 0.10000000149011612 | \"money owed \" 0.10000000149011612] "
       "nomatch:0 word\n"},
      {u"invoices", bySynonyms,
       "[\"invoices\" 1 | \"bills\" 0.10000000149011612 | \"money owed\" 0.10000000149011612] "
       "nomatch:0 word\n"},
      {u"ship invoices", byStems,
       "[\"ship invoices\" 2] nomatch:0.8\n[\"ship \" 1] nomatch:0 word\n"
       "[\"invoices\" 1 | \"invoic\" 0.05] nomatch:0 word\n"},
      // A stem is a prefix, and so a different token from the same whole word.
      {u"ships ", bySynonyms + u"," + byStems,
       "[\"ships \" 1 | \"ship \" 0.10000000149011612 | \"ship\" 0.05] nomatch:0 word\n"},
      {u"ships", bySynonyms + u"," + byStems,
       "[\"ships\" 1 | \"ship\" 0.10000000149011612] nomatch:0 word\n"},
      {u"caf\u00e9s \u4eac\u90fd", byStems,
       "[\"cafes \u4eac\u90fd\" 2] nomatch:0.8\n[\"cafes \" 1 | \"cafe\" 0.05] nomatch:0 word\n"
       "[\"\u4eac\u90fd\" 1] nomatch:0 word\n"},
  };
  for (const auto& c : cases) {
    TLQuery query;
    query.setOriginalQuery(c.text);
    query.setSearchParams(parameters(c.parameters));
    EXPECT_EQ(print(processor->termsFromQuery(query)), c.terms);
  }
}

TEST_F(QueryProcessorTest, FreeTextLooksInFourteenZonesWithTheirScores) {
  const auto terms = termsOfText(u"x");
  EXPECT_EQ(
      zonesOf(terms.at(0)),
      "zones:{13:0.9,171:0.5,104:0.5,107:1,111:0.1,115:0.1,119:0,108:0.8,112:0.1,116:0.1,120:0,147:"
      "0.2,132:0.2,131:0.2}");
}

TEST_F(QueryProcessorTest, ALeafRestrictsToItsZone) {
  auto terms = termsOfTree(leaf(SUBJECT, u"Hello, World"));
  EXPECT_EQ(print(terms), "[\"hello world\" 1] nomatch:0\n");
  EXPECT_EQ(zonesOf(terms[0]),
            "zones:{13:1,171:0,104:0,107:0,111:0,115:0,119:0,108:0,112:0,116:0,120:0,22:0,138:0,"
            "165:0,106:"
            "0,180:0,147:0,132:0,131:0}");
  terms = termsOfTree(leaf(SUBJECT, u"spam", Op::STRING_NOT_EQUAL));
  EXPECT_EQ(print(terms), "[\"spam\" 0] nomatch:1\n");
  EXPECT_EQ(zonesOf(terms[0]), "zones:{13:1}");
  // Identifiers and content types are not tokenised.
  EXPECT_EQ(print(termsOfTree(leaf(CONTENT_TYPE, u"Message/RFC822"))),
            "[\"Message/RFC822\" 1] nomatch:0\n");
}

TEST_F(QueryProcessorTest, ConditionsWithoutATerm) {
  auto number = std::make_shared<TLQueryNode>();
  number->addKey(SUBJECT);
  number->setDoubleValue(1);
  EXPECT_TRUE(termsOfTree(number).empty());
  EXPECT_TRUE(termsOfTree(leaf(SUBJECT, u"")).empty());
  EXPECT_TRUE(termsOfTree(leaf(SUBJECT, u"x", Op::INT_LESS)).empty());
  EXPECT_TRUE(termsOfTree(leaf(SUBJECT, u"x", Op::STRING_EQUAL_WORD_BREAK)).empty());
  EXPECT_TRUE(termsOfTree(inner(static_cast<Merge>(9), {leaf(SUBJECT, u"x")})).empty());
  EXPECT_TRUE(log.has("error TALQueryProcessor: Unknown query tree node mergeOp: 9."));
  log.clear();
  EXPECT_TRUE(termsOfTree(inner(Merge::OR, {leaf(READ, u"x", Op::FLOAT_LESS),
                                            inner(Merge::AND, {leaf(SUBJECT, u"x")}),
                                            leaf(SUBJECT, u"x", Op::STRING_NOT_EQUAL)}))
                  .empty());
  EXPECT_EQ(log.lines(),
            (std::vector<std::string>{
                "info TALQueryProcessor: Cannot handle op 16 under an OR node.",
                "info TALQueryProcessor: Cannot handle a non-leaf node under an OR node.",
                "info TALQueryProcessor: Cannot handle op 5 under an OR node."}));
}

TEST_F(QueryProcessorTest, AnOrNodeIsOneTermAndAnAndNodeIsFlattenedInOrder) {
  const auto either =
      inner(Merge::OR, {leaf(SUBJECT, u"one"), leaf(AUTHORS, u"two"), leaf(SUBJECT, u"one")});
  const auto terms = termsOfTree(inner(
      Merge::AND, {leaf(AUTHORS, u"first"), inner(Merge::AND, {either, leaf(X_FROM, u"third")}),
                   leaf(SUBJECT, u"last", Op::STRING_NOT_EQUAL)}));
  EXPECT_EQ(print(terms),
            "[\"first\" 1] nomatch:0\n[\"one\" 1 | \"two\" 1] nomatch:0\n[\"third\" 1] nomatch:0\n"
            "[\"last\" 0] nomatch:1\n");
  EXPECT_EQ(zonesOf(terms[1]), "zones:{13:1,107:1}");
}

TEST_F(QueryProcessorTest, HandlesATreeOfAnyDepth) {
  auto root = leaf(SUBJECT, u"deep");
  for (int i = 0; i < 100000; ++i) root = inner(Merge::AND, {root});
  EXPECT_EQ(termsOfTree(root).size(), 1u);
}

TEST_F(QueryProcessorTest, ZoneScoresFollowTheParametersOfTheSearch) {
  zoneManager.setupAttributeScoresWithSearchParams(*parameters(u"zoneScore.Subject=0.25"));
  EXPECT_EQ(zonesOf(termsOfText(u"x").at(0)).substr(0, 16), "zones:{13:0.25,1");
}
