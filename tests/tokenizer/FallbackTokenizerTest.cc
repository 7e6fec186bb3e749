#include <gtest/gtest.h>

#include "tokenizer/TLFallbackTokenizer.h"

TEST(FallbackTokenizer, LowercasesAndSplits) {
  const struct {
    TLString text;
    TLString whole;  // split at separators
    TLString split;  // split also between digits and others
  } kCases[] = {
      {u"", u"", u""},
      {u"?! \t\u3000\u0001", u"", u""},
      {u"Hello, World!", u"hello world ", u"hello world "},
      {u"  x\u2028\u00ABy\u00BB \u20AC z", u"x y z ", u"x y z "},
      {u"abc123", u"abc123 ", u"abc 123 "},
      {u"123abc", u"123abc ", u"123 abc "},
      {u"IPv6", u"ipv6 ", u"ipv 6 "},
      {u"x86y a1b2 abc123def", u"x86y a1b2 abc123def ", u"x86y a1b2 abc123def "},
      {u"12 34", u"12 34 ", u"12 34 "},
      {u"1\u0967", u"1\u0967 ", u"1 \u0967 "},
      // A character outside the basic plane is two units, neither of which separates.
      {u"\xD83D\xDE00!\xD800", u"\xD83D\xDE00 \xD800 ", u"\xD83D\xDE00 \xD800 "},
      {u"\u0130\u00C4\u03A3", u"i\u0307\u00E4\u03C2 ", u"i\u0307\u00E4\u03C2 "},
  };
  const TLFallbackTokenizer whole(false);
  for (const auto& one : kCases) {
    EXPECT_EQ(whole.CleanText(one.text), one.whole) << platform::toUTF8(one.text);
    EXPECT_EQ(TLFallbackTokenizer::getObject().CleanText(one.text), one.split)
        << platform::toUTF8(one.text);
  }
  EXPECT_EQ(whole.CleanTokens(u"Hello, World!"), (std::vector<TLString>{u"hello", u"world"}));
  EXPECT_TRUE(whole.CleanTokens(u"?!").empty());
}

TEST(FallbackTokenizer, TruncatesLongTextFirst) {
  const size_t most = TLFallbackTokenizer::kMaxTextUnits;
  const TLString fits(most, u'\u0130');  // lower case is longer
  EXPECT_EQ(TLFallbackTokenizer::getObject().CleanText(fits).size(), 2 * most + 1);
  EXPECT_EQ(TLFallbackTokenizer::getObject().CleanText(TLString(most, u'x') + u'y'),
            TLString(most, u'x') + u' ');
}
