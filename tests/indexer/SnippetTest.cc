#include <gtest/gtest.h>

#include <utility>
#include <vector>

#include "indexer/Snippet.h"

TEST(Snippet, CleansWhiteSpace) {
  const TLString two(2, u'\u2008');
  const std::vector<std::pair<TLString, std::optional<TLString>>> cases{
      {u"", std::nullopt},
      {u" \n\t\u00a0\ufffc", u" \n\t\u00a0\ufffc"},
      {u"a\n\nb", u"a" + two + u"b"},
      {u"a\nb", u"a\u2008b"},
      {u"a \n b", u"a  \u2008b"},
      {u"\ufffc \r\nhello\r\n\r\n", u"hello"},
      {u"a\t \u00a0b", u"a b"},
      {u"a\u0001\ufffcb", u"a\u0001\ufffcb"},
  };
  for (const auto& [body, snippet] : cases) EXPECT_EQ(snippetOfBody(body), snippet);
  EXPECT_EQ(snippetOfBody(std::nullopt), std::nullopt);
}

TEST(Snippet, EndsAfterAbout300UnitsAndNeverInsideACharacter) {
  EXPECT_EQ(snippetOfBody(TLString(1000, u'x'))->size(), 300u);
  EXPECT_EQ(snippetOfBody(TLString(300, u'x'))->size(), 300u);
  EXPECT_EQ(snippetOfBody(TLString(299, u'x') + u"\n\nyz")->size(), 302u);
  EXPECT_EQ(snippetOfBody(TLString(299, u'x') + u"\U0001F600 more")->size(), 299u);
  EXPECT_EQ(snippetOfBody(TLString(299, u'x') + u"e\u0301 more")->size(), 299u);
  EXPECT_EQ(snippetOfBody(TLString(298, u'x') + u"e\u0301\u0302 more")->size(), 298u);
}
