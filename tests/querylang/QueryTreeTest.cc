#include <gtest/gtest.h>

#include "querylang/TLQueryAdditions.h"
#include "tests/support/LogCapture.h"

namespace {

using Additions = TLQueryAdditions;
using Node = Additions::Node;
using Merge = TLQueryNodeMergeOp;

class QueryTree : public testing::Test {
 protected:
  static std::string print(const TLQuery& query) {
    return Additions::_stringifyQueryTree(query.root().get(), 0, true);
  }
  static std::string built(const TLString& text) {
    return print(*Additions::initWithBeaconQueryString(text, false));
  }
  // The free text, and the remaining tree.
  static std::string optimized(const TLString& text) {
    const auto query = Additions::initWithBeaconQueryString(text, true);
    EXPECT_EQ(query->rawQuery(), text);
    return '<' + platform::printable(query->originalQuery()) + '>' + print(*query);
  }

  testsupport::LogCapture log;
};

TLString repeated(TLStringView unit, size_t times) {
  TLString out;
  for (size_t i = 0; i < times; ++i) out += unit;
  return out;
}

constexpr TLStringView kFiveAttributes =
    u"(kTLItemSubject == 'x*' || kTLItemAuthors == 'x*' || kTLItemRecipients == 'x*' || "
    u"kTLItemTextContent == 'x*' || kTLItemMailboxes == 'x*')";

}  // namespace

TEST_F(QueryTree, TextBecomesATree) {
  const struct {
    const char16_t* text;
    std::string expected;  // after the connective and the first leaf; "" for no tree
  } kCases[] = {
      {u"true", "BOOL_CONSTANT, 1, "},
      {u"FALSE", "BOOL_CONSTANT, 0, "},
      {u"kTLItemSubject = 'a b'", "STRING_EQUAL, SUBJECT, a b"},
      {u"kTLItemSubject == 12", "STRING_EQUAL, SUBJECT, 12"},
      {u"kTLItemMailboxes != x", "STRING_NOT_EQUAL, MAILBOX_IDENTIFIERS, x"},
      {u"** == '*x*' && * = y", "STRING_EQUAL, ANY, *x*\n\tLEAF, STRING_EQUAL, ANY_METADATA, y"},
      {u"com_quill_mail_read == 1", "INT_EQUAL, READ, 1, "},
      {u"com_quill_mail_flagged = ' -5'", "INT_EQUAL, FLAGGED, -5, "},
      {u"com_quill_mail_flagColor == ''", "INT_EQUAL, FLAG_COLOR, 0, "},
      {u"com_quill_mail_priority == 99999999999999999999",
       "INT_EQUAL, PRIORITY, 9223372036854775807, "},
      {u"com_quill_mail_priority == '-99999999999999999999'",
       "INT_EQUAL, PRIORITY, -9223372036854775808, "},
      {u"com_quill_mail_read == 1x", "STRING_EQUAL, READ, 1x"},
      {u"com_quill_mail_read != 1", "STRING_NOT_EQUAL, READ, 1"},
      {u"com_quill_mail_dateReceived >= $time.iso(2000-01-01T00:00:00Z)",
       "FLOAT_GREATER_EQUAL, MAIL_DATE_RECEIVED, -31622400.000000, "},
      {u"com_quill_mail_dateReceived == $time.absolute(7)",
       "STRING_EQUAL, MAIL_DATE_RECEIVED, 7.000000, "},
      {u"com_quill_mail_read < $time.absolute(1)", "FLOAT_LESS, READ, 1.000000, "},
      {u"true && false && true",
       "BOOL_CONSTANT, 1, \n\tLEAF, BOOL_CONSTANT, 0, \n\tLEAF, BOOL_CONSTANT, "
       "1, "},
      {u"(true && false) && true || (false || true)",
       "BOOL_CONSTANT, 1, \n\tLEAF, BOOL_CONSTANT, 0, \n\tOR, "
       "\n\t\tLEAF, BOOL_CONSTANT, 1, \n\t\tLEAF, BOOL_CONSTANT, 0, \n\t\tLEAF, BOOL_CONSTANT, "
       "1, "},
      {u"kTLItemSubject == '\xD800'", "STRING_EQUAL, SUBJECT, \xEF\xBF\xBD"},
      {u"kTLItemSubject ==", ""},
      {u"", ""},
  };
  for (const auto& one : kCases) {
    const std::string tree = one.expected.empty() ? "" : "\nAND, \n\tLEAF, " + one.expected;
    EXPECT_EQ(built(one.text), tree) << platform::toUTF8(one.text);
  }
}

TEST_F(QueryTree, FreeTextAndConstantsLeaveTheTree) {
  const std::string subject = "\nLEAF, STRING_EQUAL, SUBJECT, ";
  const struct {
    TLString text;
    std::string expected;
  } kCases[] = {
      {u"** == 'word'", "<word>"},
      {u"* == '*a*' && ** == b && * == '' && * = *", "<a b *>"},
      {u"** > $time.absolute(1)", "<>"},
      {TLString(kFiveAttributes), "<x>"},
      {TLString(kFiveAttributes) + u" && kTLItemSubject = '*y**'", "<x>" + subject + "y*"},
      // A connective inside is ignored, and removed with the rest.
      {TLString(kFiveAttributes.substr(0, kFiveAttributes.size() - 1)) +
           u" || (kTLItemSubject = z && ** = gone))",
       "<x>"},
      {u"kTLItemSubject='x*' || kTLItemAuthors='x*' || kTLItemAuthors='x' || kTLItemMailboxes=x",
       "<>\nOR, \n\tLEAF, STRING_EQUAL, SUBJECT, x\n\tLEAF, STRING_EQUAL, AUTHORS, x"
       "\n\tLEAF, STRING_EQUAL, MAILBOX_IDENTIFIERS, x"},
      {u"kTLItemSubject == a && kTLItemSubject == 'a*'", "<>" + subject + "a"},
      // What follows the deciding constant is not evaluated.
      {u"** = a && false && ** = b", "<a>\nLEAF, BOOL_CONSTANT, 0, "},
      {u"kTLItemSubject == a && kTLItemAuthors == b && kTLItemSubject == a",
       "<>\nAND, \n\tLEAF, STRING_EQUAL, SUBJECT, a\n\tLEAF, STRING_EQUAL, AUTHORS, b"},
      {u"noSuchAttribute == x", "<>\nLEAF, STRING_EQUAL, UNKNOWN, x"},
      {u"no query", "<>"},
  };
  for (const auto& one : kCases) {
    EXPECT_EQ(optimized(one.text), one.expected) << platform::toUTF8(one.text);
  }
  const auto plain = Additions::initWithQueryString(u"a = b");
  EXPECT_EQ(plain->originalQuery(), u"a = b");
  EXPECT_FALSE(plain->hasRoot());
}

TEST_F(QueryTree, EveryStepIsLoggedAndNoTextInClear) {
  optimized(u"kTLItemSubject == 'private words' && ** == secret");
  EXPECT_EQ(log.lines(),
            (std::vector<std::string>{
                "info TLQueryParsing: Input query: \"kT...\"<49 chars>",
                "info TLQueryParsing: query tree before optimization",
                "info TLQueryParsing: \n\nAND, \n\tLEAF, STRING_EQUAL, SUBJECT, \"pr...\"<13 chars>"
                "\n\tLEAF, STRING_EQUAL, ANY, \"se...\"<6 chars>\n",
                "info TLQueryParsing: query tree after optimization",
                "info TLQueryParsing: \n\nLEAF, STRING_EQUAL, SUBJECT, \"pr...\"<13 chars>\n",
                "info TLQueryParsing: original query:->\"se...\"<6 chars><-"}));
  log.clear();
  TLQuery query;
  query.setOriginalQuery(u"words");
  Additions::addFiltersToQuery(query, {u"true", u"secret"}, true);
  EXPECT_EQ(
      log.lines(),
      (std::vector<std::string>{
          "info TLQueryParsing: Input query: \"tr...\"<14 chars>",
          "fault TLQueryParsing: Failed to parse query: \"tr...\"<14 chars>",
          "info TLQueryParsing: FilterQuery tree before optimization", "info TLQueryParsing: \n\n",
          "info TLQueryParsing: FilterQuery tree after optimization", "info TLQueryParsing: \n\n",
          "info TLQueryParsing: original query:->\"wo...\"<5 chars><-"}));
  log.clear();
  EXPECT_EQ(Additions::_lookupAttribute("REPLIED_TO"), TLAttributeKey::UNKNOWN);
  EXPECT_TRUE(log.has("error TLQueryParsing: Unknown attribute key: REPLIED_TO"));
}

TEST_F(QueryTree, FiltersReplaceTheRoot) {
  const auto query =
      Additions::initWithBeaconQueryString(u"** = word && kTLItemSubject = old", true);
  const std::string before = print(*query);
  log.clear();
  Additions::addFiltersToQuery(*query, {}, true);
  EXPECT_EQ(print(*query), before);
  EXPECT_TRUE(log.lines().empty());
  Additions::addFiltersToQuery(*query, {u"kTLItemSubject = a", u"** = lost"}, false);
  EXPECT_EQ(print(*query),
            "\nAND, \n\tLEAF, STRING_EQUAL, SUBJECT, a\n\tLEAF, STRING_EQUAL, ANY, lost");
  Additions::addFiltersToQuery(*query, {u"kTLItemSubject = a", u"** = lost"}, true);
  EXPECT_EQ(print(*query), "\nLEAF, STRING_EQUAL, SUBJECT, a");
  EXPECT_EQ(query->originalQuery(), u"word");
}

TEST_F(QueryTree, ATreeHigherThanAQueryCarriesDoesNotParse) {
  // A long chain is one node; each change of connective adds a level to the tree.
  TLQuery flat;
  flat.setRoot(Additions::_parse(repeated(u"kTLItemSubject = a || ", 1000) + u"true"));
  EXPECT_EQ(flat.root()->childAtIndex(0)->childsCount(), 1001u);
  const auto alternating = [](size_t levels) {
    return Additions::initWithBeaconQueryString(
        repeated(u"kTLItemSubject = a || kTLItemAuthors = b && ", levels / 2) +
            u"kTLItemSubject = c",
        true);
  };
  const auto highest = alternating(Additions::kMaxTreeHeight - 2);
  ASSERT_TRUE(highest->hasRoot());
  TLQuery read;
  EXPECT_TRUE(read.initWithData(highest->data()));
  EXPECT_TRUE(read.isEqual(*highest));
  for (const size_t levels : {Additions::kMaxTreeHeight, size_t{100000}}) {
    log.clear();
    EXPECT_FALSE(alternating(levels)->hasRoot());
    EXPECT_EQ(log.count("fault TLQueryParsing: Failed to parse query: "), 1u);
  }
}

TEST_F(QueryTree, OnlyAnOpenNodeTakesChildren) {
  sq::Tree tree;
  ASSERT_TRUE(sq::parse("true", tree));
  Additions::Stack none;
  EXPECT_TRUE(Additions::_build(tree.get(), none));
  Additions::Stack leaf{std::make_shared<TLQueryNode>()};
  leaf[0]->setMergeOp(Merge::LEAF);
  EXPECT_TRUE(Additions::_build(nullptr, leaf));
  EXPECT_EQ(leaf[0]->childsCount(), 0u);
  EXPECT_EQ(log.lines(),
            (std::vector<std::string>{"error TLQueryParsing: Stack is empty or contains non AND or "
                                      "OR TLNodeQuery: (null)",
                                      "error TLQueryParsing: Stack is empty or contains non AND or "
                                      "OR TLNodeQuery: \nLEAF, "}));
  // Parse nodes without meaning add nothing.
  Additions::Stack stack{std::make_shared<TLQueryNode>()};
  stack[0]->setMergeOp(Merge::AND);
  for (const int32_t type : {sq::kTokenString, sq::kTokenError, sq::kTokenEnd}) {
    const sq::node other(type, "word");
    EXPECT_TRUE(Additions::_build(&other, stack));
  }
  EXPECT_EQ(stack[0]->childsCount(), 0u);
  EXPECT_DEATH(static_cast<void>(Additions::_build(nullptr, stack)), "n != nil");
  for (int32_t token = 0; token < 30; ++token) {
    const auto op = Additions::_lookupOperator(token);
    if (token < 16 || token == 17 || token == 18 || token > 22) {
      EXPECT_EQ(op, TLQueryNodeOp::STRING_EQUAL);
    }
  }
}

TEST_F(QueryTree, OptimisingATreeOfOtherNodes) {
  Additions::Parts parts;
  EXPECT_EQ(Additions::optimizeQuery(nullptr, parts), nullptr);
  auto strange = std::make_shared<TLQueryNode>();
  strange->setMergeOp(static_cast<Merge>(7));
  EXPECT_EQ(Additions::optimizeQuery(strange, parts), nullptr);
  strange->setOp(static_cast<TLQueryNodeOp>(6));
  strange->addKey(2);
  strange->setFloatValue(0.5F);
  EXPECT_EQ(Additions::_stringifyQueryTree(strange.get(), 1),
            "\n\t(unknown: 7), (unknown: 6), (unknown: 2), 0.500000, ");
  const std::vector<std::pair<TLString, TLString>> kWildCards{
      {u"", u""},    {u"*", u"*"},   {u"**", u""},       {u"*a", u"a"},
      {u"a*", u"a"}, {u"***", u"*"}, {u"*a*b*", u"a*b"}, {u"\xD83D\xDE00", u"\xD83D\xDE00"}};
  for (const auto& [text, bare] : kWildCards) EXPECT_EQ(Additions::removeWildCard(text), bare);
}
