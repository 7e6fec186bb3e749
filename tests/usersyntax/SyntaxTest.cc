#include <gmock/gmock.h>
#include <unicode/timezone.h>

#include "usersyntax/Syntax.h"

using testing::ElementsAre;
using testing::HasSubstr;
using usersyntax::parse;
using usersyntax::printed;

namespace {

class SyntaxTest : public testing::Test {
 protected:
  SyntaxTest() { icu::TimeZone::adoptDefault(icu::TimeZone::createTimeZone("UTC")); }
};

constexpr double kNow = 1704700800;  // 2024-01-08 08:00:00 UTC

}  // namespace

TEST_F(SyntaxTest, TextBecomesATree) {
  const std::pair<const char*, const char*> kCases[] = {
      {"", "(and)"},
      {" invoice  li", "(and any:\"invoice\" any:\"li\"*)"},
      {"invoice ", "any:\"invoice\""},
      {"\"three loans\" due", "(and any:=\"three loans\" any:\"due\"*)"},
      {"a -b -\"c d\"", "(and any:\"a\" (not any:\"b\") (not any:=\"c d\"))"},
      {"a OR b c", "(or any:\"a\" (and any:\"b\" any:\"c\"*))"},
      {"(a OR b) c", "(and (or any:\"a\" any:\"b\") any:\"c\"*)"},
      {"a AND NOT (b OR c)", "(and any:\"a\" (not (or any:\"b\" any:\"c\")))"},
      {"NOT -a", "any:\"a\"*"},
      {"-(a -b) ", "(not (and any:\"a\" (not any:\"b\")))"},
      {"FROM:Mara", "from:\"Mara\"*"},
      {"-from:\"Mara Lind\"", "(not from:=\"Mara Lind\")"},
      {"from:(mara OR tom) x ", "(and (or from:\"mara\" from:\"tom\") any:\"x\")"},
      {"to:(mara subject:x) ", "(and to:\"mara\" subject:\"x\")"},
      {"is:unread has:attachment larger:2M smaller:10kb",
       "(and is:unread is:attachment larger:2097152 smaller:10240)"},
      {"date:2010", "date:1262304000..1293840000"},
      {"before:2010 after:2010-03-31", "(and date:..1262304000 date:1270080000..)"},
      {"von:mara Betreff:rechnung ist:ungelesen",
       "(and from:\"mara\" subject:\"rechnung\" is:unread)"},
      {"größer:1k APRÈS:2010 tiene:adjunto", "(and larger:1024 date:1293840000.. is:attachment)"},
      {"a ODER NICHT b ", "(or any:\"a\" (not any:\"b\"))"},
      {"folder:/home/mara/Mail", "folder:\"/home/mara/Mail\"*"},
      {"f(x) g:h(y)", "(and any:\"f(x)\" any:\"g:h(y)\"*)"},
      {"(f(x) OR y)", "(or any:\"f(x)\" any:\"y\")"},
      {"10:30 http://a.example/x", "(and any:\"10:30\" any:\"http://a.example/x\"*)"},
      {"bread or butter and not jam",
       "(and any:\"bread\" any:\"or\" any:\"butter\" any:\"and\" "
       "any:\"not\" any:\"jam\"*)"},
      {"a - b --c", "(and any:\"a\" any:\"-\" any:\"b\" any:\"--c\"*)"},
  };
  for (const auto& [text, tree] : kCases) EXPECT_EQ(printed(parse(text, kNow).root), tree) << text;
}

TEST_F(SyntaxTest, OnlyWordsArePlain) {
  for (const char* text : {"", "a b", "it's 10:30", "e-mail", "a - b", "f(x)", "bread or butter",
                           "Re: lunch", "\"open", "(open", "a OR", "from:"}) {
    EXPECT_TRUE(parse(text, kNow).plain) << text;
  }
  for (const char* text : {"-a", "\"a\"", "a OR b", "NOT a", "from:a", "(a)", "date:2010"}) {
    EXPECT_FALSE(parse(text, kNow).plain) << text;
  }
}

// Nothing that was typed is lost, and a remark explains it.
TEST_F(SyntaxTest, InvalidSyntaxIsTakenAsWords) {
  const std::tuple<const char*, const char*, const char*> cases[] = {
      {"\"three loa", "(and any:\"three\" any:\"loa\"*)", "quote is not closed"},
      {"from:\"mara ", "from:\"mara\"", "quote is not closed"},
      {"(a b", "(and any:\"(\" any:\"a\" any:\"b\"*)", "is not closed"},
      {"a )", "(and any:\"a\" any:\")\"*)", "has no partner"},
      {"a () b", "(and any:\"a\" any:\"(\" any:\")\" any:\"b\"*)", "holds nothing"},
      {"a OR", "(and any:\"a\" any:\"OR\"*)", "beside nothing"},
      {"OR a ", "(and any:\"OR\" any:\"a\")", "beside nothing"},
      {"a NOT OR b ", "(or (and any:\"a\" any:\"NOT\") any:\"b\")", "beside nothing"},
      {"colour:red ", "any:\"colour:red\"", "there is no field \"colour\""},
      {"from: mara ", "(and any:\"from:\" any:\"mara\")", "has no value"},
      {"date:2010-02-30 ", "any:\"date 2010-02-30\"", "is not a date such as"},
      {"date:2011..2010 ", "any:\"date 2011..2010\"", "is not a date such as"},
      {"is:blue ", "any:\"is blue\"", "read, unread, flagged, replied or junk"},
      {"larger:huge ", "any:\"larger huge\"", "is not a size such as"},
  };
  for (const auto& [text, tree, remark] : cases) {
    const auto query = parse(text, kNow);
    EXPECT_EQ(printed(query.root), tree) << text;
    EXPECT_THAT(query.remarks, ElementsAre(HasSubstr(remark))) << text;
  }
  // A bracket in a word is part of it.
  EXPECT_EQ(printed(parse("a) b", kNow).root), "(and any:\"a)\" any:\"b\"*)");
  EXPECT_THAT(parse("a) b", kNow).remarks, ElementsAre());
}

TEST_F(SyntaxTest, DepthIsBounded) {
  const auto nested = [](size_t depth) {
    std::string text;
    for (size_t i = 0; i < depth; ++i) text += "-(a OR b ";
    return text + std::string(depth, ')');
  };
  EXPECT_THAT(parse(nested(usersyntax::kMaxDepth), kNow).remarks, ElementsAre());
  EXPECT_THAT(parse(nested(usersyntax::kMaxDepth + 1), kNow).remarks,
              ElementsAre(HasSubstr("nested too deep")));
  EXPECT_EQ(parse(nested(100000), kNow).remarks.size(), 100000 - usersyntax::kMaxDepth);
}
